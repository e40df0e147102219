// Reading request keys by their wire type. The wire has distinct types for
// unsigned numbers, booleans and text, and a key of the wrong type counts as
// absent: a boolean is not a number here, nor a negative integer a uint64.
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <optional>
#include <string>

#include "platform/values/Value.h"

namespace qvd::wire {

inline std::optional<std::uint64_t> uint64(const platform::Value& value) {
  if (value.type() != platform::ValueType::Unsigned && value.type() != platform::ValueType::Integer) {
    return std::nullopt;
  }
  return value.uint64();
}

inline std::optional<bool> boolean(const platform::Value& value) { return value.boolean(); }

inline const std::string* text(const platform::Value& value) { return value.string(); }

}  // namespace qvd::wire
