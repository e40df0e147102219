#include "platform/bundle/internal/BundlePaths.h"

#include <limits.h>
#include <sys/stat.h>

#include <cstdlib>

namespace platform::bundle::internal {
namespace {

bool hasParentStep(std::string_view relative) {
  std::size_t at = 0;
  while (at <= relative.size()) {
    std::size_t end = relative.find('/', at);
    if (end == std::string_view::npos) end = relative.size();
    if (relative.substr(at, end - at) == "..") return true;
    at = end + 1;
  }
  return false;
}

}  // namespace

std::optional<std::string> resolvedPath(const std::string& path) {
  char resolved[PATH_MAX];
  if (::realpath(path.c_str(), resolved) == nullptr) return std::nullopt;
  return std::string(resolved);
}

std::string parentOf(const std::string& canonical) {
  const std::size_t slash = canonical.find_last_of('/');
  if (slash == 0 || slash == std::string::npos) return "/";
  return canonical.substr(0, slash);
}

std::string_view lastComponent(std::string_view canonical) {
  const std::size_t slash = canonical.find_last_of('/');
  return slash == std::string_view::npos ? canonical : canonical.substr(slash + 1);
}

bool nameEndsWith(std::string_view canonical, std::string_view suffix) {
  std::string_view name = lastComponent(canonical);
  return name.size() > suffix.size() && name.substr(name.size() - suffix.size()) == suffix;
}

bool isDirectory(const std::string& path) {
  struct stat status {};
  return ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
}

bool holdsManifest(const std::string& directory) {
  struct stat status {};
  const std::string manifest = directory == "/" ? "/Info.vmap" : directory + "/Info.vmap";
  return ::stat(manifest.c_str(), &status) == 0 && S_ISREG(status.st_mode);
}

std::optional<std::string> executableDirectory(const std::string& path) {
  if (std::optional<std::string> file = resolvedPath(path)) return parentOf(*file);
  std::string trimmed = path;
  while (trimmed.size() > 1 && trimmed.back() == '/') trimmed.pop_back();
  return resolvedPath(parentOf(trimmed));
}

std::optional<std::string> findBundleDirectory(const std::string& start) {
  std::string directory = start;
  for (;;) {
    if (holdsManifest(directory)) return directory;
    if (directory == "/") return std::nullopt;
    directory = parentOf(directory);
  }
}

std::optional<std::string> executableInBundle(const std::string& bundle, std::string_view name) {
  if (name.empty() || name.front() == '/' || hasParentStep(name)) return std::nullopt;
  std::optional<std::string> file = resolvedPath(bundle + "/" + std::string(name));
  if (!file.has_value()) return std::nullopt;
  // A link out of the bundle would make the bundle's executable some other
  // program; such a bundle has none.
  const std::string inside = bundle == "/" ? "/" : bundle + "/";
  if (file->compare(0, inside.size(), inside) != 0) return std::nullopt;
  struct stat status {};
  if (::stat(file->c_str(), &status) != 0 || !S_ISREG(status.st_mode)) return std::nullopt;
  return file;
}

}  // namespace platform::bundle::internal
