// The wire format of the message system. Every request and reply of the
// daemon travels as one frame on a Unix stream socket; clients in other
// languages build the same bytes, so this is the whole contract:
//
//   offset size  field        (integers little-endian)
//   0      4     magic        "QVMB"
//   4      2     version      1
//   6      2     flags        0x1 reply expected, 0x2 reply, 0x4 goodbye
//   8      8     message id   chosen by the sender: non-zero, increasing
//   16     8     in-reply-to  the id a reply answers; 0 otherwise
//   24     4     body length  at most kMaxBodyBytes
//   28     n     body         one CBOR item (a text-keyed map, normally)
//
// At most one flag is set; a goodbye has no body. FrameReader enforces the
// rules on the way in; encodeFrame() only ever writes frames that obey them.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <array>
#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/cbor/EncodedValue.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::mbx {

inline constexpr std::array<std::uint8_t, 4> kFrameMagic = {'Q', 'V', 'M', 'B'};
inline constexpr std::uint16_t kFrameVersion = 1;
inline constexpr std::size_t kFrameHeaderSize = 28;
inline constexpr std::uint32_t kMaxBodyBytes = 16u << 20;

inline constexpr std::uint16_t kFlagReplyExpected = 0x1;
inline constexpr std::uint16_t kFlagReply = 0x2;
inline constexpr std::uint16_t kFlagGoodbye = 0x4;
inline constexpr std::uint16_t kKnownFlags = kFlagReplyExpected | kFlagReply | kFlagGoodbye;

// What a frame is, as its flags say.
enum class FrameKind : std::uint8_t {
  Message,  // no flag: one-way
  Request,  // reply expected
  Reply,    // answers the request named by in-reply-to
  Goodbye,  // the sender is about to exit; no body
};

const char* frameKindName(FrameKind kind);
std::uint16_t flagsOf(FrameKind kind);

// The fixed-size header, as read off the wire (not yet checked).
struct FrameHeader {
  std::array<std::uint8_t, 4> magic = kFrameMagic;
  std::uint16_t version = kFrameVersion;
  std::uint16_t flags = 0;
  std::uint64_t messageId = 0;
  std::uint64_t inReplyTo = 0;
  std::uint32_t bodyLength = 0;
};

// A frame that passed every rule, with its body decoded (none for a goodbye).
struct Frame {
  FrameKind kind = FrameKind::Message;
  std::uint64_t messageId = 0;
  std::uint64_t inReplyTo = 0;
  platform::Value body;
};

void writeHeader(const FrameHeader& header, std::span<std::uint8_t, kFrameHeaderSize> out);
FrameHeader readHeader(std::span<const std::uint8_t, kFrameHeaderSize> in);

// A whole frame: header with message id 0 (the sender stamps the real id with
// setMessageId when it knows the order of sending), then the CBOR body.
// Fails with an MBX error (UnencodableBody, BodyTooLarge) when the body
// cannot be sent. `body` is ignored for a goodbye. `encoded` entries are
// added to the body's map as they are (see cbor::encodeMap).
// REQUIRES: inReplyTo != 0 exactly when kind == FrameKind::Reply; when
// `encoded` is not empty, `body` is a dictionary without their keys.
platform::Result<std::vector<std::uint8_t>> encodeFrame(
    FrameKind kind, std::uint64_t inReplyTo, const platform::Value& body,
    std::span<const platform::cbor::EncodedEntry> encoded = {});

// REQUIRES: frame.size() >= kFrameHeaderSize.
void setMessageId(std::vector<std::uint8_t>& frame, std::uint64_t messageId);

}  // namespace platform::mbx
