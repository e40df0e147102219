// Cuts one connection's incoming byte stream into frames and checks every
// rule of the wire format (Frame.h) on the way. It knows nothing of sockets:
// the connection hands it whatever the kernel returned, in pieces of any size,
// and gets back whole frames with decoded bodies, or the first broken rule.
//
//   FrameReader reader;
//   std::span<const std::uint8_t> input(bytes, n);
//   while (!input.empty()) {
//     auto step = reader.next(input);        // consumes from `input`
//     if (!step.ok()) { ...close: step.error() names the fault... }
//     if (!step->has_value()) break;         // the rest is buffered
//     handle(std::move(**step));
//   }
//
// Memory follows the frames: nothing is buffered while the stream sits
// between frames, a body that arrives in one piece is decoded where it lies,
// and a body that arrives in pieces gets a buffer grown only as far as its
// bytes have actually come (a peer that announces 16 MiB and sends ten bytes
// costs ten bytes), released again once the frame is complete.
//
// Thread safety: none; one reader belongs to one connection's delivery queue.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <optional>
#include <span>
#include <vector>

#include "platform/cbor/Cbor.h"
#include "platform/mbx/Frame.h"
#include "platform/values/Result.h"

namespace platform::mbx {

struct FrameLimits {
  // Longest body accepted; the wire never allows more than kMaxBodyBytes.
  std::uint32_t maxBodyBytes = kMaxBodyBytes;
  // Applied to every body. maxBytes is taken from maxBodyBytes.
  std::size_t maxDepth = 64;
  std::size_t maxItems = 1u << 18;
};

class FrameReader {
 public:
  // REQUIRES: limits.maxBodyBytes <= kMaxBodyBytes.
  explicit FrameReader(FrameLimits limits = {});

  FrameReader(const FrameReader&) = delete;
  FrameReader& operator=(const FrameReader&) = delete;

  // Takes bytes from the front of `input` until a frame is complete (answers
  // it), `input` is used up (answers none: a partial frame is buffered), or a
  // rule is broken (answers an error of kFrameErrorDomain). After an error
  // the reader is broken for good and answers the same error again.
  platform::Result<std::optional<Frame>> next(std::span<const std::uint8_t>& input);

  // The stream has ended. Fails (TruncatedAtEof) when it ended inside a frame.
  platform::Status finish();

  // True between frames: nothing is buffered.
  bool atFrameBoundary() const { return headerFill_ == 0; }
  bool broken() const { return fault_.has_value(); }

  // Bytes held for the frame in progress, and the capacity behind them.
  std::size_t bufferedBytes() const { return headerFill_ + body_.size(); }
  std::size_t bufferCapacity() const { return body_.capacity(); }

  // A body buffer at most this large survives the end of its frame.
  static constexpr std::size_t kRetainedCapacity = 4096;

 private:
  platform::Status checkHeader();
  platform::Result<std::optional<Frame>> finishFrame(std::span<const std::uint8_t> body);
  platform::Error fail(platform::Error error);
  void releaseBody();

  const FrameLimits limits_;
  const cbor::DecodeLimits decodeLimits_;
  std::array<std::uint8_t, kFrameHeaderSize> header_{};
  std::size_t headerFill_ = 0;  // bytes of header_ received
  FrameHeader current_;         // valid once headerFill_ == kFrameHeaderSize
  std::vector<std::uint8_t> body_;
  std::uint64_t lastMessageId_ = 0;
  std::optional<platform::Error> fault_;
};

}  // namespace platform::mbx
