#include "platform/log/InternalDiagnostics.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <atomic>
#include <cerrno>
#include <optional>
#include <string>

#include "platform/root/Root.h"

namespace platform::log {
namespace {

std::atomic<InternalDiagnosticsOverride> gOverride{InternalDiagnosticsOverride::None};

std::string_view trim(std::string_view s) {
  while (!s.empty() && (s.front() == ' ' || s.front() == '\t' || s.front() == '\r')) {
    s.remove_prefix(1);
  }
  while (!s.empty() && (s.back() == ' ' || s.back() == '\t' || s.back() == '\r')) {
    s.remove_suffix(1);
  }
  return s;
}

// The whole file, or none when it is missing, not a regular file, unreadable
// or over the limit.
std::optional<std::string> readMarkerFile(const std::string& path) {
  int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
  if (fd < 0) return std::nullopt;
  std::optional<std::string> contents;
  struct stat st {};
  if (::fstat(fd, &st) == 0 && S_ISREG(st.st_mode) &&
      static_cast<std::size_t>(st.st_size) <= kMaxInternalDiagnosticsBytes) {
    std::string text;
    char buffer[4096];
    bool failed = false;
    // Bounded even if the file grows while we read it.
    while (text.size() <= kMaxInternalDiagnosticsBytes) {
      ssize_t n = ::read(fd, buffer, sizeof buffer);
      if (n < 0 && errno == EINTR) continue;
      if (n < 0) failed = true;
      if (n <= 0) break;
      text.append(buffer, static_cast<std::size_t>(n));
    }
    if (!failed && text.size() <= kMaxInternalDiagnosticsBytes) contents = std::move(text);
  }
  ::close(fd);
  return contents;
}

}  // namespace

bool internalDiagnosticsListAdmits(std::string_view contents, std::string_view subsystem) {
  bool empty = true;
  while (!contents.empty()) {
    std::size_t newline = contents.find('\n');
    std::string_view line = trim(contents.substr(0, newline));
    contents =
        newline == std::string_view::npos ? std::string_view() : contents.substr(newline + 1);
    if (line.empty()) continue;
    empty = false;
    if (line == subsystem) return true;
  }
  return empty;
}

bool isInternalDiagnosticsVariant(std::string_view subsystem) {
  switch (gOverride.load()) {
    case InternalDiagnosticsOverride::Enabled:
      return true;
    case InternalDiagnosticsOverride::Disabled:
      return false;
    case InternalDiagnosticsOverride::None:
      break;
  }
  std::optional<std::string> contents = readMarkerFile(rootPath(kInternalDiagnosticsPath));
  return contents && internalDiagnosticsListAdmits(*contents, subsystem);
}

void setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride value) {
  gOverride.store(value);
}

}  // namespace platform::log
