#include "platform/cbor/EncodedValue.h"

#include <cassert>

#include "platform/cbor/Cbor.h"
#include "platform/cbor/internal/Encoder.h"
#include "platform/cbor/internal/Head.h"

namespace platform::cbor {

namespace {

void appendHead(std::uint8_t major, std::uint64_t argument, std::vector<std::uint8_t>& out) {
  std::uint8_t head[internal::kMaxHeadSize];
  const std::size_t length = internal::writeHead(major, argument, head);
  out.insert(out.end(), head, head + length);
}

}  // namespace

Result<EncodedValue> EncodedValue::encode(const Value& value) {
  auto bytes = std::make_shared<std::vector<std::uint8_t>>();
  if (Status encoded = cbor::encode(value, *bytes); !encoded.ok()) return encoded.error();
  return EncodedValue(std::move(bytes));
}

Result<EncodedValue> EncodedValue::encode(const Dictionary& dictionary) {
  auto bytes = std::make_shared<std::vector<std::uint8_t>>();
  if (Status encoded = encodeMap(dictionary, {}, *bytes); !encoded.ok()) return encoded.error();
  return EncodedValue(std::move(bytes));
}

EncodedValue EncodedValue::array(std::span<const EncodedValue> elements) {
  std::size_t total = internal::kMaxHeadSize;
  for (const EncodedValue& element : elements) total += element.size();
  auto bytes = std::make_shared<std::vector<std::uint8_t>>();
  bytes->reserve(total);
  appendHead(internal::kMajorArray, elements.size(), *bytes);
  for (const EncodedValue& element : elements) {
    bytes->insert(bytes->end(), element.bytes_->begin(), element.bytes_->end());
  }
  return EncodedValue(std::move(bytes));
}

Value EncodedValue::decode() const {
  // The bytes came from our own encoder, so only a limit can refuse them.
  Result<Value> value =
      cbor::decode(bytes(), DecodeLimits{.maxBytes = size(), .maxDepth = 1024, .maxItems = size()});
  return value.ok() ? std::move(value).value() : Value();
}

Status encodeMap(const Dictionary& entries, std::span<const EncodedEntry> encoded,
                 std::vector<std::uint8_t>& out) {
#ifndef NDEBUG
  for (const EncodedEntry& entry : encoded) assert(!entries.contains(entry.first));
#endif
  return internal::Encoder(out).runMap(entries, encoded);
}

}  // namespace platform::cbor
