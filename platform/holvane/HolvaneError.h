// Errors of the registration-service layer: one domain, a code per way a
// question about registrations can be refused.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::holvane {

inline constexpr std::string_view kHolvaneErrorDomain = "com.corvane.platform.holvane";

// Callers and tests match on these: never renumber.
enum class HolvaneErrorCode : std::int64_t {
  InvalidIdentifier = 1,  // empty, too long, or not a single path component
  Malformed = 2,          // a registration file of the wrong shape
};

// "invalid identifier", "malformed": a short name for logs and tests.
const char* holvaneErrorCodeName(HolvaneErrorCode code);

Error holvaneError(HolvaneErrorCode code, std::string message);

// True when `error` is of kHolvaneErrorDomain with `code`.
bool isHolvaneError(const Error& error, HolvaneErrorCode code);

}  // namespace platform::holvane
