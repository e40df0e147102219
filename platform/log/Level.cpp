#include "platform/log/Level.h"

#include <array>

namespace platform::log {
namespace {

bool equalsIgnoringAsciiCase(std::string_view a, std::string_view b) {
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    char x = a[i];
    if (x >= 'A' && x <= 'Z') x = static_cast<char>(x - 'A' + 'a');
    if (x != b[i]) return false;
  }
  return true;
}

}  // namespace

std::string_view levelName(Level level) {
  switch (level) {
    case Level::Debug:
      return "Debug";
    case Level::Info:
      return "Info";
    case Level::Default:
      return "Default";
    case Level::Error:
      return "Error";
    case Level::Fault:
      return "Fault";
  }
  return "?";
}

std::optional<Threshold> parseThreshold(std::string_view text) {
  static constexpr std::array<std::pair<std::string_view, Threshold>, 6> kNames{{
      {"debug", Threshold::Debug},
      {"info", Threshold::Info},
      {"default", Threshold::Default},
      {"error", Threshold::Error},
      {"fault", Threshold::Fault},
      {"off", Threshold::Off},
  }};
  for (const auto& [name, threshold] : kNames) {
    if (equalsIgnoringAsciiCase(text, name)) return threshold;
  }
  return std::nullopt;
}

int syslogPriority(Level level) {
  switch (level) {
    case Level::Debug:
      return 7;
    case Level::Info:
      return 6;
    case Level::Default:
      return 5;
    case Level::Error:
      return 3;
    case Level::Fault:
      return 2;
  }
  return 5;
}

}  // namespace platform::log
