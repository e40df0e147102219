// Errors of the notification layer that are not a failed system call (those
// are POSIX-domain errors naming the call and the file).
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::notify {

inline constexpr std::string_view kNotifyErrorDomain = "com.corvane.platform.notify";

// Callers and tests match on these: never renumber.
enum class NotifyErrorCode : std::int64_t {
  InvalidName = 1,       // empty, too long, or holding "/", ".." or NUL
  MalformedCounter = 2,  // the counter file does not hold a decimal count
  NotARegularFile = 3,   // something else sits where the counter file goes
  CounterOverflow = 4,   // 2^64 - 1 posts already
};

// "invalid name", "malformed counter", ...: for logs and tests.
const char* notifyErrorCodeName(NotifyErrorCode code);

Error notifyError(NotifyErrorCode code, std::string message);

bool isNotifyError(const Error& error, NotifyErrorCode code);

}  // namespace platform::notify
