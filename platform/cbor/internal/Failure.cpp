#include "platform/cbor/internal/Failure.h"

namespace platform::cbor::internal {

Error decodeFailure(ErrorCode code, std::uint64_t offset, std::string what) {
  Dictionary info;
  info.set(kLocalizedDescriptionKey, Value(std::move(what)));
  info.set(kErrorOffsetKey, Value(offset));
  return Error(std::string(kErrorDomain), static_cast<std::int64_t>(code), std::move(info));
}

Error encodeFailure(ErrorCode code, std::string what) {
  return Error(std::string(kErrorDomain), static_cast<std::int64_t>(code), std::move(what));
}

std::string quoteForMessage(std::string_view text) {
  constexpr std::size_t kMaxShown = 64;
  std::string out = "\"";
  if (text.size() <= kMaxShown) {
    out.append(text);
  } else {
    std::size_t cut = kMaxShown;
    while (cut > 0 && (static_cast<unsigned char>(text[cut]) & 0xC0) == 0x80) --cut;
    out.append(text.substr(0, cut));
    out.append("...");
  }
  out.push_back('"');
  return out;
}

}  // namespace platform::cbor::internal
