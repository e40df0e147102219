// The encoder behind cbor::encode: walks the Value tree with an explicit
// stack (a Value may nest arbitrarily deep; machine stack is never at stake)
// and writes shortest heads.
//
// Thread safety: single use by one thread; make one per value.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/cbor/Cbor.h"

namespace platform::cbor::internal {

class Encoder {
 public:
  // Write produces the bytes; Check walks the value with every check of
  // Write and produces nothing, for callers that only need to know whether
  // a value can travel.
  enum class Mode { Write, Check };

  // REQUIRES: `out` outlives the Encoder.
  explicit Encoder(std::vector<std::uint8_t>& out, Mode mode = Mode::Write)
      : out_(out), check_(mode == Mode::Check) {}
  Encoder(const Encoder&) = delete;
  Encoder& operator=(const Encoder&) = delete;

  // Appends the encoding of `value`; on failure `out` is cut back to the
  // size it had. REQUIRES: called at most once.
  Status run(const Value& value);

 private:
  // An array or dictionary whose children are being written.
  struct Frame {
    const Array* array;            // exactly one of array and dictionary
    const Dictionary* dictionary;  // is set
    std::size_t next;              // index of the next child
  };

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
  const bool check_;
  std::size_t used_ = 0;
  std::vector<Frame> stack_;
  ErrorCode failure_ = ErrorCode::kUnencodableValue;
  std::string failureWhat_;
};

}  // namespace platform::cbor::internal
