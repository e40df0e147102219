// The decoder behind cbor::decode: one pass over the input with an explicit
// stack of open arrays and maps, so nesting costs heap (bounded by
// DecodeLimits::maxDepth) and never machine stack.
//
// Thread safety: single use by one thread; make one per input.
#pragma once

#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <vector>

#include "platform/cbor/Cbor.h"

namespace platform::cbor::internal {

class Decoder {
 public:
  // REQUIRES: `input` and `limits` outlive the Decoder.
  Decoder(std::span<const std::uint8_t> input, const DecodeLimits& limits);
  Decoder(const Decoder&) = delete;
  Decoder& operator=(const Decoder&) = delete;

  // Decodes the one item that must fill the input.
  // REQUIRES: called at most once.
  Result<Value> run();

 private:
  struct Head {
    std::uint8_t major;
    std::uint8_t info;       // the additional information (low five bits)
    std::uint64_t argument;  // the value, length, count, tag or float bits
    std::size_t offset;      // where the head starts
  };

  // An array or map being filled.
  struct Frame {
    std::uint64_t remaining;  // elements (arrays) or pairs (maps) still to read
    bool isMap;
    std::size_t offset;
    std::vector<Value> elements;
    Dictionary entries;
    std::string_view key;  // the key awaiting its value (maps)
    std::size_t keyOffset;
  };

  // Each reader returns false after recording the failure in error_.
  bool readHead(Head& head);
  bool readKey(Frame& frame);
  bool readLeaf(const Head& head, Value& out);
  bool readSimple(const Head& head, Value& out);
  bool readTagged(const Head& tag, Value& out);
  bool openContainer(const Head& head);
  // Takes the payload of a byte or text string head.
  bool takePayload(const Head& head, const std::uint8_t*& payload);
  bool takeText(const Head& head, std::string_view& text);
  bool countItem(std::size_t offset);
  // Records the failure; `describe` builds the message. Kept out of line so
  // that message building stays off the hot paths.
  template <typename Describe>
  [[gnu::cold, gnu::noinline]] bool fail(ErrorCode code, std::size_t offset, Describe&& describe);

  const std::uint8_t* const data_;
  const std::size_t size_;
  const DecodeLimits& limits_;
  std::size_t pos_ = 0;
  std::size_t items_ = 0;
  std::vector<Frame> stack_;
  std::optional<Error> error_;
};

}  // namespace platform::cbor::internal
