// Errors of the container layer that are not a failed system call (those
// are POSIX-domain errors naming the call and the path).
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::container {

inline constexpr std::string_view kContainerErrorDomain = "com.corvane.platform.container";

// Callers and tests match on these: never renumber.
enum class ContainerErrorCode : std::int64_t {
  InvalidIdentifier = 1,  // empty, ".", too long, or holding "/", ".." or NUL
  NotADirectory = 2,      // a symbolic link or a file where a directory belongs
};

Error containerError(ContainerErrorCode code, std::string message);

bool isContainerError(const Error& error, ContainerErrorCode code);

}  // namespace platform::container
