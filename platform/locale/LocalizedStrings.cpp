#include "platform/locale/LocalizedStrings.h"

#include <sys/stat.h>

#include <cerrno>

#include "platform/locale/LocaleName.h"
#include "platform/vmap/Reader.h"

namespace platform::locale {

namespace {

constexpr std::size_t kMaxTableBytes = 1 << 20;

bool isOneComponent(std::string_view name) {
  return !name.empty() && name != "." && name != ".." && name.find('/') == std::string_view::npos &&
         name.find('\0') == std::string_view::npos;
}

std::string tablePath(std::string_view bundlePath, const std::string& language,
                      std::string_view table) {
  return std::string(bundlePath) + "/locale/" + language + "/" + std::string(table) + ".vmap";
}

// The table at `path`: none when there is no such file.
Result<std::optional<Dictionary>> readTable(const std::string& path) {
  struct stat st {};
  if (::lstat(path.c_str(), &st) != 0) {
    if (errno == ENOENT || errno == ENOTDIR) return std::optional<Dictionary>();
    return Error::posix(errno, path);
  }
  vmap::ReadLimits limits;
  limits.maxBytes = kMaxTableBytes;
  Result<Value> document = vmap::readFile(path, limits);
  if (!document.ok()) return document.error();
  const Dictionary* strings = document->dictionary();
  if (strings == nullptr) return Error(std::string(kPosixErrorDomain), EINVAL, path + ": not a dictionary");
  return std::optional<Dictionary>(*strings);
}

}  // namespace

Result<std::optional<Dictionary>> localizedTable(std::string_view bundlePath,
                                                 std::string_view table,
                                                 const std::string& locale) {
  if (!isOneComponent(table)) return Error::posix(EINVAL, "table name");
  for (const std::string& language : lookupOrder(locale)) {
    if (!isOneComponent(language)) continue;
    Result<std::optional<Dictionary>> found = readTable(tablePath(bundlePath, language, table));
    if (!found.ok() || found->has_value()) return found;
  }
  return std::optional<Dictionary>();
}

std::optional<std::string> localizedString(std::string_view bundlePath, std::string_view table,
                                           std::string_view key, const std::string& locale) {
  if (!isOneComponent(table)) return std::nullopt;
  for (const std::string& language : lookupOrder(locale)) {
    if (!isOneComponent(language)) continue;
    Result<std::optional<Dictionary>> found = readTable(tablePath(bundlePath, language, table));
    if (!found.ok() || !found->has_value()) continue;
    if (const std::string* text = (*found)->get(key).string()) return *text;
  }
  return std::nullopt;
}

}  // namespace platform::locale
