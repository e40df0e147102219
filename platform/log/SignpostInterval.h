// A named interval in a log category, for tracing where time goes: its begin
// and end are logged at debug level, the end with the time elapsed. While
// debug logging is off for the category, an interval reads no clock and logs
// nothing.
//
//   SignpostInterval interval(opsLog, "QVHVInitialization");
//   ... every return closes it ...
//
// Thread safety: an interval belongs to the scope that made it.
#pragma once

#include <chrono>
#include <string_view>

#include "platform/log/Logger.h"

namespace platform::log {

class SignpostInterval {
 public:
  // REQUIRES: `name` outlives the interval (a literal, in practice).
  SignpostInterval(const Logger& logger, std::string_view name);
  ~SignpostInterval();
  SignpostInterval(const SignpostInterval&) = delete;
  SignpostInterval& operator=(const SignpostInterval&) = delete;

 private:
  const Logger& logger_;
  const std::string_view name_;
  const bool enabled_;
  std::chrono::steady_clock::time_point begin_;
};

}  // namespace platform::log
