#include "Quorvex/QVFileURL.h"

namespace {

bool isUnreserved(unsigned char c) {
  return (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '-' ||
         c == '.' || c == '_' || c == '~' || c == '/';
}

int hexValue(char c) {
  if (c >= '0' && c <= '9') return c - '0';
  if (c >= 'a' && c <= 'f') return c - 'a' + 10;
  if (c >= 'A' && c <= 'F') return c - 'A' + 10;
  return -1;
}

}  // namespace

std::string QVFileURLFromPath(std::string_view path) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string url = "file://";
  url.reserve(url.size() + path.size());
  for (unsigned char c : path) {
    if (isUnreserved(c)) {
      url.push_back(static_cast<char>(c));
    } else {
      url.push_back('%');
      url.push_back(kHex[c >> 4]);
      url.push_back(kHex[c & 0xF]);
    }
  }
  return url;
}

std::optional<std::string> QVPathFromFileURL(std::string_view url) {
  constexpr std::string_view kScheme = "file://";
  constexpr std::string_view kLocalhost = "localhost";
  if (url.substr(0, kScheme.size()) != kScheme) return std::nullopt;
  url.remove_prefix(kScheme.size());
  if (url.substr(0, kLocalhost.size()) == kLocalhost) url.remove_prefix(kLocalhost.size());
  if (url.empty() || url.front() != '/') return std::nullopt;
  std::string path;
  path.reserve(url.size());
  for (std::size_t i = 0; i < url.size(); ++i) {
    if (url[i] != '%') {
      path.push_back(url[i]);
      continue;
    }
    if (i + 2 >= url.size()) return std::nullopt;
    int hi = hexValue(url[i + 1]), lo = hexValue(url[i + 2]);
    if (hi < 0 || lo < 0 || (hi == 0 && lo == 0)) return std::nullopt;
    path.push_back(static_cast<char>(hi * 16 + lo));
    i += 2;
  }
  return path;
}
