// Kind-exact comparison of Values for codec tests. Value's own operator==
// is property-list equality (1 == 1.0 == true, dictionaries in any order),
// which would hide a codec that turns an Integer into a Real or reorders
// keys; this one does not.
//
// Thread safety: pure functions.
#pragma once

#include <optional>
#include <string>

#include "platform/values/Value.h"

namespace platform::cbor::oracle {

// None when `actual` is identical to `expected`: same kinds all the way down,
// same key order, reals and dates with the same bits (any NaN matches any
// NaN). Otherwise the path and nature of the first difference.
std::optional<std::string> firstDifference(const Value& expected, const Value& actual);

inline bool identical(const Value& a, const Value& b) {
  return !firstDifference(a, b);
}

}  // namespace platform::cbor::oracle
