// The text of one output line, in the plain or the journal form:
//
//   2025-01-02T03:04:05.123456Z qvd[812:815] <Default> [com.corvane.Quorvex:ops] message
//   <5>qvd[812:815] <Default> [com.corvane.Quorvex:ops] message
//
// (process name, [pid:thread id], level, [subsystem:category], message; the
// default log, which has no subsystem, leaves out the bracketed scope).
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include <cstdint>
#include <ctime>
#include <string>
#include <string_view>

#include "platform/log/Level.h"

namespace platform::log::internal {

enum class LineForm : std::uint8_t {
  Plain,    // stderr read by a person or a file: starts with a UTC timestamp
  Journal,  // stderr connected to journald: starts with "<priority>"
};

struct LineOrigin {
  std::string_view processName;
  long pid = 0;
  long threadId = 0;
  std::timespec time{};  // CLOCK_REALTIME
};

// Appends `text` so that it cannot end the line or steer a terminal:
// "\\" "\n" "\r" "\t" are written as two-character escapes and other control
// bytes (0x00-0x1F, 0x7F) as "\xHH". Other bytes, UTF-8 included, are kept.
void appendEscaped(std::string& out, std::string_view text);

// The whole line, newline included; the message is escaped.
std::string renderLine(LineForm form, const LineOrigin& origin, Level level,
                       std::string_view subsystem, std::string_view category,
                       std::string_view message);

}  // namespace platform::log::internal
