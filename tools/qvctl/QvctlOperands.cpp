#include "tools/qvctl/QvctlOperands.h"

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <iterator>

#include "platform/vmap/Reader.h"
#include "tools/qvctl/Qvctl.h"
#include "tools/qvctl/QvctlJson.h"

namespace qvctl::internal {

using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Status;
using platform::Uuid;
using platform::Value;

Error usageError(std::string message) {
  return Error(std::string(kUsageErrorDomain), kExitUsage, std::move(message));
}

std::size_t Scanned::count(std::string_view name) const {
  auto [from, to] = options.equal_range(name);
  return static_cast<std::size_t>(std::distance(from, to));
}

std::optional<std::string> Scanned::single(std::string_view name) const {
  auto found = options.find(name);
  if (found == options.end()) return std::nullopt;
  return found->second;
}

Result<Scanned> scan(std::span<const std::string_view> args,
                     std::initializer_list<std::string_view> valued,
                     std::initializer_list<std::string_view> switches,
                     std::initializer_list<std::string_view> repeatable) {
  auto among = [](std::initializer_list<std::string_view> list, std::string_view name) {
    return std::find(list.begin(), list.end(), name) != list.end();
  };
  Scanned scanned;
  bool optionsEnded = false;
  for (std::size_t i = 0; i < args.size(); ++i) {
    std::string_view arg = args[i];
    if (optionsEnded || arg.size() < 2 || arg[0] != '-') {
      scanned.operands.push_back(arg);
      continue;
    }
    if (arg == "--") {
      optionsEnded = true;
      continue;
    }
    std::string_view name = arg;
    std::optional<std::string_view> inlineValue;
    if (std::size_t equals = arg.find('='); equals != std::string_view::npos) {
      name = arg.substr(0, equals);
      inlineValue = arg.substr(equals + 1);
    }
    if (among(switches, name) && !inlineValue) {
      scanned.options.emplace(std::string(name), "");
    } else if (among(valued, name)) {
      if (!inlineValue && i + 1 >= args.size()) {
        return usageError(std::string(name) + " needs a value");
      }
      scanned.options.emplace(std::string(name),
                              std::string(inlineValue ? *inlineValue : args[++i]));
    } else {
      return usageError("unknown option " + std::string(arg));
    }
    if (!among(repeatable, name) && scanned.count(name) > 1) {
      return usageError(std::string(name) + " given more than once");
    }
  }
  return scanned;
}

Status needOperands(const Scanned& scanned, std::size_t least, std::size_t most) {
  if (scanned.operands.size() < least) return usageError("too few arguments");
  if (scanned.operands.size() > most) {
    return usageError("unexpected argument " + std::string(scanned.operands[most]));
  }
  return platform::okStatus();
}

Result<std::uint64_t> numberOption(std::string_view name, std::string_view text) {
  std::optional<std::uint64_t> number = parseNumber(text);
  if (!number) return usageError(std::string(name) + ": not a number: " + std::string(text));
  return *number;
}

Result<Uuid> uuidOperand(std::string_view text) {
  std::optional<Uuid> uuid = Uuid::parse(text);
  if (!uuid) return usageError("not a UUID: " + std::string(text));
  return *uuid;
}

Result<std::pair<std::string, std::string>> keyValue(std::string_view what, std::string_view text) {
  std::size_t equals = text.find('=');
  if (equals == std::string_view::npos || equals == 0) {
    return usageError(std::string(what) + ": expected KEY=VALUE, got " + std::string(text));
  }
  return std::pair<std::string, std::string>(text.substr(0, equals), text.substr(equals + 1));
}

Result<Dictionary> jsonObjectOption(std::string_view name, std::string_view text) {
  Result<Value> value = valueFromJsonText(text);
  if (!value.ok()) return usageError(std::string(name) + ": " + value.error().description());
  if (value.value().dictionary() == nullptr) {
    return usageError(std::string(name) + ": expected a JSON object");
  }
  return *value.value().dictionary();
}

Result<Dictionary> dictionaryFileOption(std::string_view name, const std::string& path) {
  // A vmap document (either form) first; anything else is read as JSON.
  constexpr std::uintmax_t kMaxBytes = 1 << 20;
  std::error_code error;
  const std::uintmax_t size = std::filesystem::file_size(path, error);
  if (error) return usageError(std::string(name) + ": " + path + ": " + error.message());
  if (size > kMaxBytes) return usageError(std::string(name) + ": " + path + ": larger than 1 MiB");
  if (Result<Value> vmap = platform::vmap::readFile(path); vmap.ok()) {
    if (vmap.value().dictionary() == nullptr) {
      return usageError(std::string(name) + ": " + path + ": expected a dictionary");
    }
    return *vmap.value().dictionary();
  }
  std::ifstream in(path, std::ios::binary);
  std::string text((std::istreambuf_iterator<char>(in)), std::istreambuf_iterator<char>());
  return jsonObjectOption(std::string(name) + " " + path, text);
}

Result<std::vector<std::string>> absolutePaths(const std::vector<std::string_view>& operands,
                                               std::string_view cwd) {
  std::vector<std::string> paths;
  for (std::string_view operand : operands) {
    Result<std::string> path = absolutePath(operand, cwd);
    if (!path.ok()) return path.error();
    paths.push_back(std::move(path).value());
  }
  return paths;
}

Result<QVDPlugInMap> plugInOperands(const std::vector<std::string_view>& operands,
                                    std::string_view cwd) {
  QVDPlugInMap plugIns;
  for (std::string_view operand : operands) {
    std::size_t equals = operand.find('=');
    Result<Uuid> uuid = uuidOperand(operand.substr(0, equals));
    if (!uuid.ok()) return uuid.error();
    std::string path;
    if (equals != std::string_view::npos) {
      Result<std::string> absolute = absolutePath(operand.substr(equals + 1), cwd);
      if (!absolute.ok()) return absolute.error();
      path = std::move(absolute).value();
    }
    plugIns.emplace_back(std::move(path), uuid.value());
  }
  return plugIns;
}

}  // namespace qvctl::internal
