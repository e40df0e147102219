#include "tools/qvctl/QvctlArguments.h"

#include <charconv>
#include <filesystem>

#include "tools/qvctl/QvctlHelp.h"
#include "tools/qvctl/QvctlOperands.h"

namespace qvctl {

using platform::Result;
using platform::Status;

std::optional<std::uint64_t> parseNumber(std::string_view text) {
  int base = 10;
  if (text.size() > 2 && text[0] == '0' && (text[1] == 'x' || text[1] == 'X')) {
    text.remove_prefix(2);
    base = 16;
  }
  std::uint64_t number = 0;
  auto [end, error] = std::from_chars(text.data(), text.data() + text.size(), number, base);
  if (text.empty() || error != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return number;
}

Result<std::string> absolutePath(std::string_view path, std::string_view currentDirectory) {
  if (path.empty()) return internal::usageError("empty path");
  if (path.front() == '/') return std::string(path);
  if (currentDirectory.empty()) {
    return internal::usageError("cannot make " + std::string(path) +
                                " absolute: the current directory is unknown");
  }
  std::string tidy =
      (std::filesystem::path(currentDirectory) / std::filesystem::path(path)).lexically_normal();
  while (tidy.size() > 1 && tidy.back() == '/') tidy.pop_back();
  return tidy;
}

Result<Invocation> parseArguments(std::span<const std::string_view> args,
                                  std::string_view currentDirectory) {
  Invocation invocation;
  // Global options may come anywhere before "--"; the rest belongs to the command.
  std::vector<std::string_view> rest;
  bool wantsHelp = false;
  bool optionsEnded = false;
  for (std::size_t i = 0; i < args.size(); ++i) {
    std::string_view arg = args[i];
    if (!optionsEnded && arg == "--json") {
      invocation.format = OutputFormat::Json;
    } else if (!optionsEnded && (arg == "--help" || arg == "-h")) {
      wantsHelp = true;
    } else if (!optionsEnded && (arg == "--service" || arg.starts_with("--service="))) {
      std::string_view name;
      if (arg == "--service") {
        if (i + 1 >= args.size()) return internal::usageError("--service needs a value");
        name = args[++i];
      } else {
        name = arg.substr(std::string_view("--service=").size());
      }
      if (name.empty()) return internal::usageError("--service needs a value");
      invocation.service = std::string(name);
    } else {
      if (arg == "--") optionsEnded = true;
      rest.push_back(arg);
    }
  }
  if (rest.empty()) {
    if (wantsHelp) return invocation;  // the overview
    return internal::usageError("no command given");
  }
  const CommandInfo* info = commandNamed(rest.front());
  if (info == nullptr) return internal::usageError("unknown command " + std::string(rest.front()));
  invocation.command = info->command;
  if (wantsHelp) {
    invocation.helpTopic = info->command;
    invocation.command = Command::Help;
    return invocation;
  }
  Status parsed =
      internal::parseCommandArguments(invocation, std::span(rest).subspan(1), currentDirectory);
  if (!parsed.ok()) return parsed.error();
  return invocation;
}

}  // namespace qvctl
