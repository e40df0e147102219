// The encoder behind cbor::encode: walks the Value tree with an explicit
// stack (a Value may nest arbitrarily deep; machine stack is never at stake)
// and writes shortest heads.
//
// Thread safety: single use by one thread; make one per value.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/cbor/Cbor.h"
#include "platform/cbor/EncodedValue.h"

namespace platform::cbor::internal {

class Encoder {
 public:
  // REQUIRES: `out` outlives the Encoder.
  explicit Encoder(std::vector<std::uint8_t>& out) : out_(out) {}
  Encoder(const Encoder&) = delete;
  Encoder& operator=(const Encoder&) = delete;

  // Appends the encoding of `value`; on failure `out` is cut back to the
  // size it had. REQUIRES: called at most once.
  Status run(const Value& value);
  // Appends the map of `entries` followed by `encoded` (see
  // cbor::encodeMap); on failure `out` is cut back. REQUIRES: called at most
  // once, and not together with run().
  Status runMap(const Dictionary& entries, std::span<const EncodedEntry> encoded);

 private:
  // An array or dictionary whose children are being written.
  struct Frame {
    const Array* array;            // exactly one of array and dictionary
    const Dictionary* dictionary;  // is set
    std::size_t next;              // index of the next child
  };

  // Writes `root` and everything below it; false when something cannot be
  // encoded.
  bool writeTree(const Value& root);
  // Each writer returns false when the value cannot be encoded.
  bool writeValue(const Value& value);
  bool writeText(std::string_view text);
  void writeHead(std::uint8_t major, std::uint64_t argument);
  void writeBytes(const void* bytes, std::size_t size);
  void writeDouble(double d);
  void writeByte(std::uint8_t byte);
  // Where the next `size` bytes go; grows out_ geometrically.
  std::uint8_t* room(std::size_t size);
  // "/rules/3/name": where the walk is, for error messages.
  std::string currentPath() const;

  // out_ runs ahead of what is written (its tail is scratch space) until
  // run() trims it to used_.
  std::vector<std::uint8_t>& out_;
  std::size_t used_ = 0;
  std::vector<Frame> stack_;
  ErrorCode failure_ = ErrorCode::kUnencodableValue;
  std::string failureWhat_;
};

}  // namespace platform::cbor::internal
