#include "platform/mbx/FrameReader.h"

#include <algorithm>
#include <bit>
#include <cassert>
#include <cstdio>
#include <cstring>
#include <string>

#include "platform/mbx/MbxError.h"

namespace platform::mbx {

namespace {

cbor::DecodeLimits decodeLimitsFor(const FrameLimits& limits) {
  cbor::DecodeLimits decode;
  decode.maxBytes = limits.maxBodyBytes;
  decode.maxDepth = limits.maxDepth;
  decode.maxItems = limits.maxItems;
  return decode;
}

std::string hex16(std::uint16_t value) {
  char text[8];
  std::snprintf(text, sizeof text, "0x%04x", value);
  return text;
}

FrameKind kindOf(std::uint16_t flags) {
  switch (flags) {
    case kFlagReplyExpected: return FrameKind::Request;
    case kFlagReply: return FrameKind::Reply;
    case kFlagGoodbye: return FrameKind::Goodbye;
    default: return FrameKind::Message;
  }
}

}  // namespace

FrameReader::FrameReader(FrameLimits limits)
    : limits_(limits), decodeLimits_(decodeLimitsFor(limits)) {
  assert(limits.maxBodyBytes <= kMaxBodyBytes);
}

Error FrameReader::fail(Error error) {
  fault_ = error;
  headerFill_ = 0;
  body_ = std::vector<std::uint8_t>();
  return error;
}

void FrameReader::releaseBody() {
  body_.clear();
  if (body_.capacity() > kRetainedCapacity) body_ = std::vector<std::uint8_t>();
}

Status FrameReader::checkHeader() {
  const FrameHeader& h = current_;
  if (h.version != kFrameVersion) {
    return makeFrameError(FrameFault::UnknownVersion, "version " + std::to_string(h.version));
  }
  if ((h.flags & ~kKnownFlags) != 0) {
    return makeFrameError(FrameFault::UnknownFlags, "flags " + hex16(h.flags));
  }
  if (std::popcount(h.flags) > 1) {
    return makeFrameError(FrameFault::ConflictingFlags, "flags " + hex16(h.flags));
  }
  if (h.messageId == 0) return makeFrameError(FrameFault::ZeroMessageId);
  if (h.messageId <= lastMessageId_) {
    return makeFrameError(FrameFault::NonIncreasingMessageId,
                          "id " + std::to_string(h.messageId) + " after " +
                              std::to_string(lastMessageId_));
  }
  if (h.bodyLength > limits_.maxBodyBytes) {
    return makeFrameError(FrameFault::BodyTooLarge,
                          std::to_string(h.bodyLength) + " bytes, limit " +
                              std::to_string(limits_.maxBodyBytes));
  }
  const FrameKind kind = kindOf(h.flags);
  if (kind == FrameKind::Goodbye && h.bodyLength != 0) {
    return makeFrameError(FrameFault::GoodbyeWithBody,
                          std::to_string(h.bodyLength) + " bytes");
  }
  if (kind == FrameKind::Reply && h.inReplyTo == 0) {
    return makeFrameError(FrameFault::ReplyWithoutRequestId);
  }
  if (kind != FrameKind::Reply && h.inReplyTo != 0) {
    return makeFrameError(FrameFault::RequestIdWithoutReply,
                          "in-reply-to " + std::to_string(h.inReplyTo) + " on a " +
                              frameKindName(kind));
  }
  lastMessageId_ = h.messageId;
  return okStatus();
}

Result<std::optional<Frame>> FrameReader::next(std::span<const std::uint8_t>& input) {
  if (fault_) return *fault_;

  while (headerFill_ < kFrameHeaderSize) {
    if (input.empty()) return std::optional<Frame>();
    const std::size_t take = std::min(kFrameHeaderSize - headerFill_, input.size());
    std::memcpy(header_.data() + headerFill_, input.data(), take);
    const std::size_t before = headerFill_;
    headerFill_ += take;
    input = input.subspan(take);
    // The magic is checked as soon as it is complete, so that a stray client
    // speaking another protocol is turned away without waiting for 28 bytes.
    if (before < kFrameMagic.size() && headerFill_ >= kFrameMagic.size() &&
        std::memcmp(header_.data(), kFrameMagic.data(), kFrameMagic.size()) != 0) {
      return fail(makeFrameError(FrameFault::BadMagic));
    }
    if (headerFill_ == kFrameHeaderSize) {
      current_ = readHeader(std::span<const std::uint8_t, kFrameHeaderSize>(header_));
      if (Status checked = checkHeader(); !checked.ok()) return fail(checked.error());
    }
  }

  const std::size_t length = current_.bodyLength;
  if (body_.empty() && input.size() >= length) {
    // The whole body is at hand: decode it where it lies.
    std::span<const std::uint8_t> body = input.first(length);
    input = input.subspan(length);
    return finishFrame(body);
  }
  const std::size_t take = std::min(length - body_.size(), input.size());
  const std::size_t wanted = body_.size() + take;
  if (wanted > body_.capacity()) {
    // Grow with what has arrived, never to what the header merely claims.
    body_.reserve(std::min(length, std::max(wanted, 2 * body_.capacity())));
  }
  body_.insert(body_.end(), input.begin(), input.begin() + static_cast<std::ptrdiff_t>(take));
  input = input.subspan(take);
  if (body_.size() < length) return std::optional<Frame>();
  return finishFrame(body_);
}

Result<std::optional<Frame>> FrameReader::finishFrame(std::span<const std::uint8_t> body) {
  Frame frame;
  frame.kind = kindOf(current_.flags);
  frame.messageId = current_.messageId;
  frame.inReplyTo = current_.inReplyTo;
  if (frame.kind != FrameKind::Goodbye) {
    Result<Value> decoded = cbor::decode(body, decodeLimits_);
    if (!decoded.ok()) {
      return fail(makeFrameError(FrameFault::UndecodableBody, decoded.error().description()));
    }
    frame.body = std::move(decoded).value();
  }
  headerFill_ = 0;
  releaseBody();
  return std::optional<Frame>(std::move(frame));
}

Status FrameReader::finish() {
  if (fault_) return *fault_;
  if (headerFill_ == 0) return okStatus();
  const std::size_t have = headerFill_ + body_.size();
  std::string detail = std::to_string(have) + " bytes of a frame";
  if (headerFill_ == kFrameHeaderSize) {
    detail += " of " + std::to_string(kFrameHeaderSize + current_.bodyLength);
  }
  return fail(makeFrameError(FrameFault::TruncatedAtEof, detail));
}

}  // namespace platform::mbx
