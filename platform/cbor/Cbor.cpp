#include "platform/cbor/Cbor.h"

#include "platform/cbor/internal/Decoder.h"
#include "platform/cbor/internal/Encoder.h"

namespace platform::cbor {

Result<Value> decode(std::span<const std::uint8_t> bytes, const DecodeLimits& limits) {
  return internal::Decoder(bytes, limits).run();
}

Status encode(const Value& value, std::vector<std::uint8_t>& out) {
  return internal::Encoder(out).run(value);
}

Result<std::vector<std::uint8_t>> encode(const Value& value) {
  std::vector<std::uint8_t> out;
  Status status = encode(value, out);
  if (!status.ok()) return status.error();
  return out;
}

}  // namespace platform::cbor
