#include "platform/mbx/Frame.h"

#include <cassert>
#include <cstring>
#include <string>

#include "platform/cbor/Cbor.h"
#include "platform/mbx/MbxError.h"

namespace platform::mbx {

namespace {

template <class T>
void putLittle(std::uint8_t* out, T value) {
  for (std::size_t i = 0; i < sizeof(T); ++i) out[i] = static_cast<std::uint8_t>(value >> (8 * i));
}

template <class T>
T getLittle(const std::uint8_t* in) {
  T value = 0;
  for (std::size_t i = 0; i < sizeof(T); ++i) value |= static_cast<T>(in[i]) << (8 * i);
  return value;
}

// Room reserved up front when encoding: most requests and replies fit.
constexpr std::size_t kTypicalFrameBytes = 512;

}  // namespace

const char* frameKindName(FrameKind kind) {
  switch (kind) {
    case FrameKind::Message: return "message";
    case FrameKind::Request: return "request";
    case FrameKind::Reply: return "reply";
    case FrameKind::Goodbye: return "goodbye";
  }
  return "unknown";
}

std::uint16_t flagsOf(FrameKind kind) {
  switch (kind) {
    case FrameKind::Message: return 0;
    case FrameKind::Request: return kFlagReplyExpected;
    case FrameKind::Reply: return kFlagReply;
    case FrameKind::Goodbye: return kFlagGoodbye;
  }
  return 0;
}

void writeHeader(const FrameHeader& header, std::span<std::uint8_t, kFrameHeaderSize> out) {
  std::memcpy(out.data(), header.magic.data(), 4);
  putLittle<std::uint16_t>(out.data() + 4, header.version);
  putLittle<std::uint16_t>(out.data() + 6, header.flags);
  putLittle<std::uint64_t>(out.data() + 8, header.messageId);
  putLittle<std::uint64_t>(out.data() + 16, header.inReplyTo);
  putLittle<std::uint32_t>(out.data() + 24, header.bodyLength);
}

FrameHeader readHeader(std::span<const std::uint8_t, kFrameHeaderSize> in) {
  FrameHeader header;
  std::memcpy(header.magic.data(), in.data(), 4);
  header.version = getLittle<std::uint16_t>(in.data() + 4);
  header.flags = getLittle<std::uint16_t>(in.data() + 6);
  header.messageId = getLittle<std::uint64_t>(in.data() + 8);
  header.inReplyTo = getLittle<std::uint64_t>(in.data() + 16);
  header.bodyLength = getLittle<std::uint32_t>(in.data() + 24);
  return header;
}

Result<std::vector<std::uint8_t>> encodeFrame(FrameKind kind, std::uint64_t inReplyTo,
                                              const Value& body,
                                              std::span<const cbor::EncodedEntry> encoded) {
  assert((kind == FrameKind::Reply) == (inReplyTo != 0));
  assert(encoded.empty() || body.dictionary() != nullptr);
  std::vector<std::uint8_t> frame(kFrameHeaderSize);
  if (kind != FrameKind::Goodbye) {
    frame.reserve(kTypicalFrameBytes);  // one allocation for most messages
    const Status written = encoded.empty() ? cbor::encode(body, frame)
                                           : cbor::encodeMap(*body.dictionary(), encoded, frame);
    if (!written.ok()) {
      const std::string* text = written.error().localizedDescription();
      return makeError(ErrorCode::UnencodableBody, text != nullptr ? *text : std::string());
    }
  }
  const std::size_t bodyLength = frame.size() - kFrameHeaderSize;
  if (bodyLength > kMaxBodyBytes) {
    return makeError(ErrorCode::BodyTooLarge,
                     std::to_string(bodyLength) + " bytes, limit " + std::to_string(kMaxBodyBytes));
  }
  FrameHeader header;
  header.flags = flagsOf(kind);
  header.inReplyTo = inReplyTo;
  header.bodyLength = static_cast<std::uint32_t>(bodyLength);
  writeHeader(header, std::span<std::uint8_t, kFrameHeaderSize>(frame.data(), kFrameHeaderSize));
  return frame;
}

void setMessageId(std::vector<std::uint8_t>& frame, std::uint64_t messageId) {
  assert(frame.size() >= kFrameHeaderSize);
  putLittle<std::uint64_t>(frame.data() + 8, messageId);
}

}  // namespace platform::mbx
