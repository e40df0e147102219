// The failures of the CBOR codec. Every error it returns has domain
// kErrorDomain, a code from ErrorCode and a description that names where the
// fault is ("duplicate map key \"a\" at offset 17"). Decoding errors also carry
// that offset as an Unsigned under kErrorOffsetKey in the user information.
//
// Thread safety: constants and pure functions; call from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::cbor {

inline constexpr std::string_view kErrorDomain = "CBOR";

// User-information key: the byte offset of the fault in the decoded input.
inline constexpr std::string_view kErrorOffsetKey = "Offset";

// The codes are part of the wire protocol's error replies: never renumber.
enum class ErrorCode : std::int64_t {
  kTruncated = 1,                // input ends inside an item, or a length exceeds it
  kTrailingBytes = 2,            // bytes after the single top-level item
  kTooDeep = 3,                  // more arrays/maps open than DecodeLimits::maxDepth
  kTooManyItems = 4,             // more items than DecodeLimits::maxItems
  kTooLarge = 5,                 // input longer than DecodeLimits::maxBytes
  kInvalidUtf8 = 6,              // a text string (or a string being encoded) is not UTF-8
  kDuplicateKey = 7,             // the same key twice in one map
  kNonTextKey = 8,               // a map key that is not a text string
  kIndefiniteLength = 9,         // indefinite-length item or a stray break code
  kUnsupportedTag = 10,          // any tag but 1 (date) and 37 (UUID)
  kUnsupportedSimpleValue = 11,  // null, undefined and every simple value but true/false
  kBadUuidLength = 12,           // tag 37 on a byte string that is not 16 bytes long
  kIntegerOutOfRange = 13,       // a negative integer below INT64_MIN
  kUnencodableValue = 14,        // encoding met a none value
  kMalformedHead = 15,           // reserved additional information (28-30, or 31 on 0/1/6)
  kBadTagContent = 16,           // tag 1 on a non-number, tag 37 on a non-byte-string
};

// "truncated", "duplicate key", ...: a short fixed name for logs and tests.
const char* errorCodeName(ErrorCode code);

// The code of a CBOR error; none for errors of other domains or unknown codes.
std::optional<ErrorCode> errorCodeOf(const Error& error);

// The offset recorded in a decoding error; none when there is none.
std::optional<std::uint64_t> errorOffsetOf(const Error& error);

}  // namespace platform::cbor
