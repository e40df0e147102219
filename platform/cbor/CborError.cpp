#include "platform/cbor/CborError.h"

namespace platform::cbor {

const char* errorCodeName(ErrorCode code) {
  switch (code) {
    case ErrorCode::kTruncated:
      return "truncated";
    case ErrorCode::kTrailingBytes:
      return "trailing bytes";
    case ErrorCode::kTooDeep:
      return "too deep";
    case ErrorCode::kTooManyItems:
      return "too many items";
    case ErrorCode::kTooLarge:
      return "too large";
    case ErrorCode::kInvalidUtf8:
      return "invalid UTF-8";
    case ErrorCode::kDuplicateKey:
      return "duplicate key";
    case ErrorCode::kNonTextKey:
      return "non-text key";
    case ErrorCode::kIndefiniteLength:
      return "indefinite length";
    case ErrorCode::kUnsupportedTag:
      return "unsupported tag";
    case ErrorCode::kUnsupportedSimpleValue:
      return "unsupported simple value";
    case ErrorCode::kBadUuidLength:
      return "bad UUID length";
    case ErrorCode::kIntegerOutOfRange:
      return "integer out of range";
    case ErrorCode::kUnencodableValue:
      return "unencodable value";
    case ErrorCode::kMalformedHead:
      return "malformed head";
    case ErrorCode::kBadTagContent:
      return "bad tag content";
  }
  return "unknown";
}

std::optional<ErrorCode> errorCodeOf(const Error& error) {
  if (error.domain() != kErrorDomain) return std::nullopt;
  auto code = error.code();
  if (code < static_cast<std::int64_t>(ErrorCode::kTruncated) ||
      code > static_cast<std::int64_t>(ErrorCode::kBadTagContent))
    return std::nullopt;
  return static_cast<ErrorCode>(code);
}

std::optional<std::uint64_t> errorOffsetOf(const Error& error) {
  if (error.domain() != kErrorDomain || !error.userInfo()) return std::nullopt;
  return error.userInfo()->get(kErrorOffsetKey).uint64();
}

}  // namespace platform::cbor
