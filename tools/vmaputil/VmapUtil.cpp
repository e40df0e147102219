#include "tools/vmaputil/VmapUtil.h"

#include <charconv>
#include <filesystem>
#include <optional>
#include <string>

#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace platform::vmap {
namespace {

constexpr std::string_view kUsageLine =
    "usage: vmaputil print FILE | convert --to xml|binary IN [OUT] | lint FILE... | "
    "get FILE KEY[.KEY...] | --help\n";

constexpr std::string_view kHelp =
    "vmaputil: read, check and convert vmap documents (Info.vmap and the like).\n"
    "\n"
    "  vmaputil print FILE                      describe the document's value\n"
    "  vmaputil convert --to xml|binary IN [OUT]\n"
    "                                           rewrite IN in the given form, to OUT\n"
    "                                           (replaced atomically) or to stdout\n"
    "  vmaputil lint FILE...                    check documents: \"FILE: OK\" or the error\n"
    "  vmaputil get FILE KEY[.KEY...]           the value at a key path; a number\n"
    "                                           indexes an array\n"
    "  vmaputil --help                          this text\n"
    "\n"
    "Exit status: 0 success, 1 a document error, 2 a usage error.\n";

void put(std::FILE* stream, std::string_view text) {
  std::fwrite(text.data(), 1, text.size(), stream);
}

int usage(std::FILE* err, std::string_view problem) {
  put(err, "vmaputil: " + std::string(problem) + "\n");
  put(err, kUsageLine);
  return kExitUsage;
}

// The library wants absolute paths; users type relative ones and expect to
// see them in messages again.
std::string absolute(std::string_view path) {
  std::error_code ec;
  std::filesystem::path p = std::filesystem::absolute(std::filesystem::path(path), ec);
  return ec ? std::string(path) : p.lexically_normal().string();
}

std::string asTyped(const Error& error, const std::string& absolutePath, std::string_view typed) {
  std::string text = error.description();
  if (text.starts_with(absolutePath)) text.replace(0, absolutePath.size(), typed);
  return text;
}

std::optional<Value> load(std::string_view file, std::FILE* err) {
  const std::string path = absolute(file);
  Result<Value> value = readFile(path);
  if (value.ok()) return std::move(value).value();
  put(err, asTyped(value.error(), path, file) + "\n");
  return std::nullopt;
}

int print(std::span<const std::string_view> args, std::FILE* out, std::FILE* err) {
  if (args.size() != 1) return usage(err, "print takes one FILE");
  std::optional<Value> value = load(args[0], err);
  if (!value) return kExitDocumentError;
  put(out, value->description() + "\n");
  return kExitOk;
}

int convert(std::span<const std::string_view> args, std::FILE* out, std::FILE* err) {
  if (args.size() < 3 || args.size() > 4 || args[0] != "--to")
    return usage(err, "convert takes --to xml|binary IN [OUT]");
  Format format;
  if (args[1] == "xml") format = Format::Xml;
  else if (args[1] == "binary") format = Format::Binary;
  else return usage(err, "unknown form \"" + std::string(args[1]) + "\" (xml or binary)");
  std::optional<Value> value = load(args[2], err);
  if (!value) return kExitDocumentError;
  if (args.size() == 4) {
    const std::string path = absolute(args[3]);
    Status status = writeFileAtomically(path, *value, format);
    if (status.ok()) return kExitOk;
    put(err, asTyped(status.error(), path, args[3]) + "\n");
    return kExitDocumentError;
  }
  Result<std::string> document = write(*value, format);
  if (!document.ok()) {
    put(err, std::string(args[2]) + ": " + document.error().description() + "\n");
    return kExitDocumentError;
  }
  put(out, *document);
  return kExitOk;
}

int lint(std::span<const std::string_view> args, std::FILE* out, std::FILE* err) {
  if (args.empty()) return usage(err, "lint takes at least one FILE");
  int status = kExitOk;
  for (std::string_view file : args) {
    if (load(file, err)) {
      put(out, std::string(file) + ": OK\n");
    } else {
      status = kExitDocumentError;
    }
  }
  return status;
}

// The value at a dotted key path; a decimal component indexes an array.
const Value* lookUp(const Value& root, std::string_view keyPath) {
  const Value* current = &root;
  for (;;) {
    const std::size_t dot = keyPath.find('.');
    const std::string_view part = keyPath.substr(0, dot);
    if (const Dictionary* d = current->dictionary()) {
      current = d->find(part);
    } else if (const Array* a = current->array()) {
      std::size_t index = 0;
      auto [end, ec] = std::from_chars(part.data(), part.data() + part.size(), index);
      current = ec == std::errc() && end == part.data() + part.size() ? a->at(index) : nullptr;
    } else {
      current = nullptr;
    }
    if (!current || dot == std::string_view::npos) return current;
    keyPath.remove_prefix(dot + 1);
  }
}

int get(std::span<const std::string_view> args, std::FILE* out, std::FILE* err) {
  if (args.size() != 2) return usage(err, "get takes FILE and KEY[.KEY...]");
  std::optional<Value> value = load(args[0], err);
  if (!value) return kExitDocumentError;
  const Value* found = lookUp(*value, args[1]);
  if (!found) {
    put(err, std::string(args[0]) + ": no value at " + std::string(args[1]) + "\n");
    return kExitDocumentError;
  }
  put(out, found->description() + "\n");
  return kExitOk;
}

}  // namespace

int runVmapUtil(std::span<const std::string_view> args, std::FILE* out, std::FILE* err) {
  if (args.empty()) return usage(err, "no command");
  const std::string_view command = args[0];
  const auto rest = args.subspan(1);
  if (command == "--help" || command == "-h" || command == "help") {
    put(out, kHelp);
    return kExitOk;
  }
  if (command == "print") return print(rest, out, err);
  if (command == "convert") return convert(rest, out, err);
  if (command == "lint") return lint(rest, out, err);
  if (command == "get") return get(rest, out, err);
  return usage(err, "unknown command \"" + std::string(command) + "\"");
}

}  // namespace platform::vmap
