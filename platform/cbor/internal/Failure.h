// Builders of the codec's Error values, so every failure has the same shape:
// domain "CBOR", an ErrorCode, a description, and for decoding the offset.
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/cbor/CborError.h"

namespace platform::cbor::internal {

// `what` should end with "at offset N" for the same `offset`.
Error decodeFailure(ErrorCode code, std::uint64_t offset, std::string what);

Error encodeFailure(ErrorCode code, std::string what);

// Text for an error message: at most 64 bytes of `text`, cut at a character
// boundary, in double quotes ("\"name\"" or "\"very-long-k...\"").
std::string quoteForMessage(std::string_view text);

}  // namespace platform::cbor::internal
