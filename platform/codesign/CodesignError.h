// Errors of the entitlement layer: one domain, a code per way a grant or an
// entitlements file can be refused or a question cannot be answered.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::codesign {

inline constexpr std::string_view kCodesignErrorDomain = "com.corvane.platform.codesign";

// Callers and tests match on these: never renumber.
enum class CodesignErrorCode : std::int64_t {
  InvalidPath = 1,        // empty, relative or longer than PATH_MAX
  TooManyGrantFiles = 2,  // the grants directory holds more files than the limit
  NotADirectory = 3,      // the grants directory or a bundle path is something else
  Untrusted = 4,          // owned by another user, or writable by group or others
  NotARegularFile = 5,    // a symbolic link, device, FIFO or directory
  TooLarge = 6,           // more bytes than the limit
  Malformed = 7,          // not a vmap document, or not of the expected shape
};

// "untrusted", "too many grant files", ...: a short name for logs and tests.
const char* codesignErrorCodeName(CodesignErrorCode code);

Error codesignError(CodesignErrorCode code, std::string message);

// True when `error` is of kCodesignErrorDomain with `code`.
bool isCodesignError(const Error& error, CodesignErrorCode code);

}  // namespace platform::codesign
