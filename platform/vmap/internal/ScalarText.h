// The text forms of the XML form's scalar elements: <integer>, <real>,
// <date>. Parsers take the element's text with surrounding white space
// already removed.
//
// Thread safety: pure functions.
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform::vmap::internal {

// Decimal digits with an optional sign. Fits int64: an Integer; a larger
// positive number that fits uint64: an Unsigned. Otherwise none, with `why`
// set ("not a decimal integer", "out of the 64-bit range").
std::optional<Value> parseInteger(std::string_view text, std::string& why);

// A decimal number with optional fraction and exponent, or nan, inf, -inf.
// Out-of-range magnitudes (1e999) are refused rather than rounded to inf.
std::optional<double> parseReal(std::string_view text, std::string& why);

// The shortest text that parseReal reads back as the same double (the sign
// of zero included).
void appendReal(std::string& out, double value);

// "YYYY-MM-DDTHH:MM:SS[.fraction]Z", UTC, years 0000-9999.
std::optional<Date> parseDate(std::string_view text);

// The text parseDate reads back as exactly `date`, or none when there is no
// such text (not finite, outside the years, or a fraction before 1970 that a
// decimal cannot pin down).
std::optional<std::string> formatDate(Date date);

}  // namespace platform::vmap::internal
