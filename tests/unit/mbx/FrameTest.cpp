// The wire format and the incremental frame reader, without sockets: exact
// header bytes, streams cut into pieces, memory that follows the bytes,
// and one case per framing rule.
#include <gtest/gtest.h>

#include "platform/mbx/FrameReader.h"
#include "platform/mbx/MbxError.h"
#include "tests/unit/mbx/FrameFaultCases.h"

namespace platform::mbx {
namespace {

using namespace testing;

// Feeds `bytes` in pieces of `piece` bytes; collects frames until the first
// error, which it returns in `error`.
std::vector<Frame> readAll(FrameReader& reader, const Bytes& bytes, std::size_t piece,
                           std::optional<Error>* error = nullptr) {
  std::vector<Frame> frames;
  for (std::size_t at = 0; at < bytes.size(); at += piece) {
    std::span<const std::uint8_t> input(bytes.data() + at, std::min(piece, bytes.size() - at));
    while (!input.empty()) {
      auto step = reader.next(input);
      if (!step.ok()) {
        if (error != nullptr) *error = step.error();
        return frames;
      }
      if (!step.value()) break;
      frames.push_back(std::move(*step.value()));
    }
  }
  return frames;
}

TEST(MbxFrame, HeaderIsLittleEndianAtFixedOffsetsAndUnsendableBodiesAreRefused) {
  const Value body = Dictionary{{"a", 1}};
  Bytes frame = frameBytes(FrameKind::Reply, 0x0102030405060708ull, body, 0x1122334455667788ull);
  const Bytes cbor = cborOf(body);
  const Bytes expectedHeader = {'Q',  'V',  'M',  'B',  1,
                                0,    2,    0,    0x08, 0x07,
                                0x06, 0x05, 0x04, 0x03, 0x02,
                                0x01, 0x88, 0x77, 0x66, 0x55,
                                0x44, 0x33, 0x22, 0x11, static_cast<std::uint8_t>(cbor.size()),
                                0,    0,    0};
  EXPECT_EQ(frame, concat({expectedHeader, cbor}));
  EXPECT_EQ(errorCodeOf(encodeFrame(FrameKind::Message, 0, Value()).error()),
            ErrorCode::UnencodableBody);
  EXPECT_EQ(errorCodeOf(encodeFrame(FrameKind::Request, 0, Value(Data(kMaxBodyBytes))).error()),
            ErrorCode::BodyTooLarge);
  // A goodbye never carries a body, whatever it is given.
  auto goodbye = encodeFrame(FrameKind::Goodbye, 0, Dictionary{{"x", 1}});
  ASSERT_TRUE(goodbye.ok());
  EXPECT_EQ(goodbye.value().size(), kFrameHeaderSize);
  EXPECT_EQ(goodbye.value()[6], kFlagGoodbye);
}

TEST(MbxFrameReader, EveryKindRoundTripsInPiecesOfAnySize) {
  const Value map = Dictionary{{"blob", Data(3000, 7)}};
  const Bytes stream = concat(
      {frameBytes(FrameKind::Message, 1, map), frameBytes(FrameKind::Request, 2, Dictionary{}),
       frameBytes(FrameKind::Reply, 9, Value(42), 2), frameBytes(FrameKind::Goodbye, 10, Value())});
  for (std::size_t piece : {std::size_t{1}, std::size_t{27}, std::size_t{29}, stream.size()}) {
    SCOPED_TRACE(piece);
    FrameReader reader;
    std::optional<Error> error;
    std::vector<Frame> frames = readAll(reader, stream, piece, &error);
    ASSERT_FALSE(error) << error->description();
    ASSERT_EQ(frames.size(), 4u);
    EXPECT_EQ(frames[0].body, map);
    EXPECT_EQ(frames[1].kind, FrameKind::Request);
    EXPECT_EQ(frames[1].messageId, 2u);
    EXPECT_EQ(frames[2].kind, FrameKind::Reply);
    EXPECT_EQ(frames[2].inReplyTo, 2u);
    EXPECT_EQ(frames[2].body, Value(42));  // not a map: still a frame
    EXPECT_EQ(frames[3].kind, FrameKind::Goodbye);
    EXPECT_TRUE(reader.finish().ok());
  }
}

TEST(MbxFrameReader, MemoryFollowsTheBytesThatArrived) {
  // A header that announces the largest body, and ten bytes of it.
  FrameReader liar;
  Bytes claim = rawFrame(header(0, 1, kMaxBodyBytes), Bytes(10, 0xa0));
  std::span<const std::uint8_t> input(claim);
  ASSERT_TRUE(liar.next(input).ok());
  EXPECT_EQ(liar.bufferedBytes(), kFrameHeaderSize + 10);
  EXPECT_LT(liar.bufferCapacity(), 1024u);

  // A 1 MiB body in 4 KiB pieces: the buffer is let go once the frame is complete.
  FrameReader reader;
  const Bytes big = frameBytes(FrameKind::Message, 1, Value(Data(1u << 20, 1)));
  EXPECT_EQ(readAll(reader, big, 4096).size(), 1u);
  EXPECT_EQ(reader.bufferedBytes(), 0u);
  EXPECT_LE(reader.bufferCapacity(), FrameReader::kRetainedCapacity);
}

TEST(MbxFrameReader, EachBrokenRuleIsNamedAndFinal) {
  for (const FaultCase& c : frameFaultCases()) {
    SCOPED_TRACE(c.name);
    for (std::size_t piece : {std::size_t{1}, c.bytes.size()}) {
      FrameReader reader;
      std::optional<Error> error;
      readAll(reader, c.bytes, piece, &error);
      if (c.atEndOfStream) {
        ASSERT_FALSE(error);
        error = reader.finish().error();
      }
      ASSERT_TRUE(error.has_value());
      EXPECT_EQ(frameFaultOf(*error), c.fault) << error->description();
      // Broken for good: even a valid frame is refused with the same fault.
      Bytes good = frameBytes(FrameKind::Message, 1000, Dictionary{});
      std::span<const std::uint8_t> again(good);
      auto next = reader.next(again);
      ASSERT_FALSE(next.ok());
      EXPECT_EQ(frameFaultOf(next.error()), c.fault);
    }
  }
  // End of stream anywhere inside a frame is truncation.
  const Bytes frame = frameBytes(FrameKind::Request, 1, Dictionary{{"k", "value"}});
  for (std::size_t cut : {std::size_t{4}, kFrameHeaderSize, frame.size() - 1}) {
    FrameReader reader;
    readAll(reader, Bytes(frame.begin(), frame.begin() + cut), 1000);
    EXPECT_EQ(frameFaultOf(reader.finish().error()), FrameFault::TruncatedAtEof) << cut;
  }
}

}  // namespace
}  // namespace platform::mbx
