// Severity levels and the thresholds that filter them.
//
// Thread safety: plain values and pure functions; safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

namespace platform::log {

// In increasing order of severity.
enum class Level : std::uint8_t {
  Debug,
  Info,
  Default,  // the "notice" level: what a message is when nothing else is said
  Error,
  Fault,
};

// The lowest level a logger lets through; Off lets nothing through.
enum class Threshold : std::uint8_t {
  Debug,
  Info,
  Default,
  Error,
  Fault,
  Off,
};

inline constexpr Threshold kDefaultThreshold = Threshold::Default;

inline constexpr bool admits(Threshold threshold, Level level) {
  return static_cast<std::uint8_t>(level) >= static_cast<std::uint8_t>(threshold);
}

// "Debug", "Info", "Default", "Error", "Fault": the name shown in log lines.
std::string_view levelName(Level level);

// "debug", "info", "default", "error", "fault" or "off", in any ASCII case.
// Anything else: none.
std::optional<Threshold> parseThreshold(std::string_view text);

// The syslog priority journald files a line under: fault 2 (critical),
// error 3, default 5 (notice), info 6, debug 7.
int syslogPriority(Level level);

}  // namespace platform::log
