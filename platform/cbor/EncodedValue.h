// A value already in its CBOR encoding. A sender that has the bytes of a
// large value can put them into a message as they are: framing the message
// then copies them instead of walking the value again, and the peer reads
// exactly what the value itself would have given.
//
// Thread safety: immutable; copies share the bytes and may be used from any
// thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <span>
#include <string>
#include <utility>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::cbor {

class EncodedValue {
 public:
  // Fails as cbor::encode does (a none value, text that is not UTF-8).
  static platform::Result<EncodedValue> encode(const platform::Value& value);
  // The same for a dictionary that is not (yet) a Value, without a copy.
  static platform::Result<EncodedValue> encode(const platform::Dictionary& dictionary);
  // The array of `elements`, in order: a head and their bytes.
  static EncodedValue array(std::span<const EncodedValue> elements);

  std::span<const std::uint8_t> bytes() const { return {bytes_->data(), bytes_->size()}; }
  std::size_t size() const { return bytes_->size(); }
  // The value back, for descriptions and tests: a full decode.
  platform::Value decode() const;

 private:
  explicit EncodedValue(std::shared_ptr<const std::vector<std::uint8_t>> bytes)
      : bytes_(std::move(bytes)) {}

  // Never null, and always exactly one item of the mapping.
  std::shared_ptr<const std::vector<std::uint8_t>> bytes_;
};

// A map entry whose value is already encoded.
using EncodedEntry = std::pair<std::string, EncodedValue>;

// Appends the map of `entries` followed by `encoded`: the bytes that the
// dictionary holding all of them, in that order, encodes to. On error `out`
// is left as it was. REQUIRES: no key is both in `entries` and in `encoded`,
// and no key appears twice in `encoded`.
platform::Status encodeMap(const platform::Dictionary& entries,
                           std::span<const EncodedEntry> encoded, std::vector<std::uint8_t>& out);

}  // namespace platform::cbor
