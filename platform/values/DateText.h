// The ISO 8601 text form of dates ("2026-11-23T03:24:38Z"), used by vmap
// documents and descriptions.
//
// Thread safety: pure functions.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform {

// UTC with a 'Z'; a fractional part is written only when the date has one,
// with as many digits as it takes to read back the same value.
std::string formatIso8601(Date date);

// Accepts "YYYY-MM-DDTHH:MM:SS[.fraction]Z" (UTC only). Anything else: none.
std::optional<Date> parseIso8601(std::string_view text);

}  // namespace platform
