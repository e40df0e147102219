#include "platform/codesign/internal/CanonicalPath.h"

#include <climits>
#include <cstdlib>
#include <vector>

namespace platform::codesign::internal {

std::string lexicallyNormal(std::string_view path) {
  std::vector<std::string_view> parts;
  std::size_t at = 0;
  while (at < path.size()) {
    std::size_t end = path.find('/', at);
    if (end == std::string_view::npos) end = path.size();
    std::string_view part = path.substr(at, end - at);
    if (part == "..") {
      if (!parts.empty()) parts.pop_back();  // "/.." is "/"
    } else if (!part.empty() && part != ".") {
      parts.push_back(part);
    }
    at = end + 1;
  }
  if (parts.empty()) return "/";
  std::string out;
  for (std::string_view part : parts) {
    out.push_back('/');
    out.append(part);
  }
  return out;
}

std::string canonicalPath(std::string_view path) {
  const std::string text(path);
  char resolved[PATH_MAX];
  if (::realpath(text.c_str(), resolved) != nullptr) return resolved;
  return lexicallyNormal(path);
}

}  // namespace platform::codesign::internal
