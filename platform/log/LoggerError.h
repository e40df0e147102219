// Why a logger could not be made. Such errors are platform::Error values of
// the domain kLoggerErrorDomain whose code is a LoggerError.
//
// Thread safety: plain values and pure functions; safe from any thread.
#pragma once

#include <cstdint>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::log {

inline constexpr std::string_view kLoggerErrorDomain = "platform.log";

enum class LoggerError : std::uint8_t {
  EmptyName = 1,     // an empty subsystem or category
  NameTooLong,       // over 128 bytes
  InvalidCharacter,  // anything but visible ASCII, or one of , : =
  TooManyLoggers,    // the process already has LoggerRegistry::kMaxLoggers
};

std::string_view loggerErrorName(LoggerError error);

// An Error of kLoggerErrorDomain, described as "<what> for logger
// (subsystem, category)" with both names escaped and cut short.
Error makeLoggerError(LoggerError error, std::string_view subsystem, std::string_view category);

}  // namespace platform::log
