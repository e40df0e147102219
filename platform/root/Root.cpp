#include "platform/root/Root.h"

#include <cstdlib>

namespace platform {
namespace {

std::string normalize(std::string root) {
  if (root.empty()) return "/";
  while (root.size() > 1 && root.back() == '/') root.pop_back();
  return root;
}

std::string& storage() {
  static std::string root = [] {
    const char* env = std::getenv("QV_ROOT");
    return normalize(env ? env : "/");
  }();
  return root;
}

}  // namespace

const std::string& rootDirectory() { return storage(); }

std::string rootPath(std::string_view relative) {
  while (!relative.empty() && relative.front() == '/') relative.remove_prefix(1);
  const std::string& root = rootDirectory();
  std::string out = root == "/" ? std::string("/") : root + "/";
  out.append(relative);
  return out;
}

void setRootDirectoryForTesting(std::string root) { storage() = normalize(std::move(root)); }

}  // namespace platform
