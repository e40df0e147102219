// The wire format and the incremental frame reader, without sockets: exact
// header bytes, streams cut into pieces, memory that follows the bytes,
// and one case per framing rule.
#include <gtest/gtest.h>

#include "platform/mbx/FrameReader.h"
#include "platform/mbx/MbxError.h"
#include "tests/unit/mbx/FrameFaultCases.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace platform::mbx {
namespace {

using namespace testing;

// Feeds `bytes` in pieces of `piece` bytes; collects frames until the first error.
struct Outcome {
  std::vector<Frame> frames;
  std::optional<Error> error;
};
Outcome readAll(FrameReader& reader, const Bytes& bytes, std::size_t piece) {
  Outcome outcome;
  for (std::size_t at = 0; at < bytes.size(); at += piece) {
    std::span<const std::uint8_t> input(bytes.data() + at, std::min(piece, bytes.size() - at));
    while (!input.empty()) {
      auto step = reader.next(input);
      if (!step.ok()) {
        outcome.error = step.error();
        return outcome;
      }
      if (!step.value()) break;
      outcome.frames.push_back(std::move(*step.value()));
    }
  }
  return outcome;
}

TEST(MbxFrame, HeaderIsLittleEndianAtFixedOffsets) {
  const Value body = Dictionary{{"a", 1}};
  Bytes frame = frameBytes(FrameKind::Reply, 0x0102030405060708ull, body, 0x1122334455667788ull);
  const Bytes cbor = cborOf(body);
  const Bytes expectedHeader = {'Q', 'V', 'M', 'B', 1, 0, 2, 0,
                                0x08, 0x07, 0x06, 0x05, 0x04, 0x03, 0x02, 0x01,
                                0x88, 0x77, 0x66, 0x55, 0x44, 0x33, 0x22, 0x11,
                                static_cast<std::uint8_t>(cbor.size()), 0, 0, 0};
  ASSERT_EQ(frame.size(), kFrameHeaderSize + cbor.size());
  EXPECT_EQ(Bytes(frame.begin(), frame.begin() + kFrameHeaderSize), expectedHeader);
  EXPECT_EQ(Bytes(frame.begin() + kFrameHeaderSize, frame.end()), cbor);

  FrameHeader read = readHeader(std::span<const std::uint8_t, kFrameHeaderSize>(frame.data(), 28));
  EXPECT_EQ(read.flags, kFlagReply);
  EXPECT_EQ(read.messageId, 0x0102030405060708ull);
  EXPECT_EQ(read.inReplyTo, 0x1122334455667788ull);
  EXPECT_EQ(read.bodyLength, cbor.size());
}

TEST(MbxFrame, EncodingRefusesWhatCannotBeSent) {
  auto none = encodeFrame(FrameKind::Message, 0, Value());
  ASSERT_FALSE(none.ok());
  EXPECT_EQ(errorCodeOf(none.error()), ErrorCode::UnencodableBody);

  auto huge = encodeFrame(FrameKind::Request, 0, Value(Data(kMaxBodyBytes)));
  ASSERT_FALSE(huge.ok());
  EXPECT_EQ(errorCodeOf(huge.error()), ErrorCode::BodyTooLarge);

  // A goodbye never carries a body, whatever it is given.
  auto goodbye = encodeFrame(FrameKind::Goodbye, 0, Dictionary{{"x", 1}});
  ASSERT_TRUE(goodbye.ok());
  EXPECT_EQ(goodbye.value().size(), kFrameHeaderSize);
  EXPECT_EQ(goodbye.value()[6], kFlagGoodbye);
}

TEST(MbxFrameReader, EveryKindRoundTripsInPiecesOfAnySize) {
  const Value map = Dictionary{{"op", "register"}, {"n", 3}, {"blob", Data(3000, 7)}};
  const Bytes stream = concat({frameBytes(FrameKind::Message, 1, map),
                               frameBytes(FrameKind::Request, 2, Dictionary{}),
                               frameBytes(FrameKind::Reply, 9, Value(42), 2),
                               frameBytes(FrameKind::Goodbye, 10, Value())});
  for (std::size_t piece : {std::size_t{1}, std::size_t{3}, std::size_t{27}, std::size_t{28},
                            std::size_t{29}, std::size_t{1000}, stream.size()}) {
    SCOPED_TRACE(piece);
    FrameReader reader;
    Outcome outcome = readAll(reader, stream, piece);
    ASSERT_FALSE(outcome.error) << outcome.error->description();
    ASSERT_EQ(outcome.frames.size(), 4u);
    EXPECT_EQ(outcome.frames[0].kind, FrameKind::Message);
    EXPECT_EQ(outcome.frames[0].body, map);
    EXPECT_EQ(outcome.frames[1].kind, FrameKind::Request);
    EXPECT_EQ(outcome.frames[1].messageId, 2u);
    EXPECT_EQ(outcome.frames[2].kind, FrameKind::Reply);
    EXPECT_EQ(outcome.frames[2].inReplyTo, 2u);
    EXPECT_EQ(outcome.frames[2].body, Value(42));  // not a map: still a frame
    EXPECT_EQ(outcome.frames[3].kind, FrameKind::Goodbye);
    EXPECT_TRUE(outcome.frames[3].body.isNone());
    EXPECT_TRUE(reader.atFrameBoundary());
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
  EXPECT_FALSE(liar.finish().ok());

  // A 1 MiB body in 4 KiB pieces: the buffer never exceeds the body, and is
  // let go once the frame is complete.
  FrameReader reader;
  Bytes big = frameBytes(FrameKind::Message, 1, Value(Data(1u << 20, 1)));
  std::size_t largest = 0;
  for (std::size_t at = 0; at < big.size(); at += 4096) {
    std::span<const std::uint8_t> piece(big.data() + at, std::min<std::size_t>(4096, big.size() - at));
    auto step = reader.next(piece);
    ASSERT_TRUE(step.ok());
    largest = std::max(largest, reader.bufferCapacity());
    if (step.value()) {
      EXPECT_EQ(step.value()->body.data()->size(), 1u << 20);
    }
  }
  EXPECT_LE(largest, big.size() - kFrameHeaderSize);
  EXPECT_EQ(reader.bufferedBytes(), 0u);
  EXPECT_LE(reader.bufferCapacity(), FrameReader::kRetainedCapacity);

  // A frame that arrives whole is decoded in place: nothing is buffered.
  FrameReader direct;
  std::span<const std::uint8_t> whole(big);
  ASSERT_TRUE(direct.next(whole).ok());
  EXPECT_EQ(direct.bufferCapacity(), 0u);
}

TEST(MbxFrameReader, EachBrokenRuleIsNamedAndFinal) {
  for (const FaultCase& c : frameFaultCases()) {
    SCOPED_TRACE(c.name);
    for (std::size_t piece : {std::size_t{1}, c.bytes.size()}) {
      FrameReader reader;
      Outcome outcome = readAll(reader, c.bytes, piece);
      if (c.atEndOfStream) {
        ASSERT_FALSE(outcome.error);
        Status end = reader.finish();
        ASSERT_FALSE(end.ok());
        outcome.error = end.error();
      }
      ASSERT_TRUE(outcome.error.has_value());
      EXPECT_EQ(frameFaultOf(*outcome.error), c.fault) << outcome.error->description();
      EXPECT_TRUE(reader.broken());
      // Broken for good: even a valid frame is refused with the same fault.
      Bytes good = frameBytes(FrameKind::Message, 1000, Dictionary{});
      std::span<const std::uint8_t> again(good);
      auto next = reader.next(again);
      ASSERT_FALSE(next.ok());
      EXPECT_EQ(frameFaultOf(next.error()), c.fault);
    }
  }
}

TEST(MbxFrameReader, LimitsHoldAtTheirEdges) {
  FrameLimits limits;
  limits.maxBodyBytes = 100;
  limits.maxItems = 10;
  {
    FrameReader reader(limits);
    Outcome at = readAll(reader, withBody(cborOf(Value(Data(97))), 0, 1), 1000);  // 99 bytes
    ASSERT_FALSE(at.error) << at.error->description();
    Outcome over = readAll(reader, rawFrame(header(0, 2, 101), Bytes(101, 0)), 1000);
    ASSERT_TRUE(over.error);
    EXPECT_EQ(frameFaultOf(*over.error), FrameFault::BodyTooLarge);
  }
  {
    Array nine;
    for (int i = 0; i < 9; ++i) nine.append(Value(i));
    FrameReader reader(limits);
    EXPECT_FALSE(readAll(reader, withBody(cborOf(Value(nine)), 0, 1), 1000).error);
    nine.append(Value(9));
    Outcome over = readAll(reader, withBody(cborOf(Value(nine)), 0, 2), 1000);
    ASSERT_TRUE(over.error);
    EXPECT_EQ(frameFaultOf(*over.error), FrameFault::UndecodableBody);
  }
  FrameReader deep;
  EXPECT_FALSE(readAll(deep, withBody(nestedArrays(64), 0, 1), 1000).error);
}

TEST(MbxFrameReader, EndOfStreamInsideAFrameIsTruncation) {
  const Bytes frame = frameBytes(FrameKind::Request, 1, Dictionary{{"k", "value"}});
  for (std::size_t cut : {std::size_t{1}, std::size_t{4}, kFrameHeaderSize, frame.size() - 1}) {
    SCOPED_TRACE(cut);
    FrameReader reader;
    Outcome outcome = readAll(reader, Bytes(frame.begin(), frame.begin() + cut), 1000);
    ASSERT_FALSE(outcome.error);
    EXPECT_FALSE(reader.atFrameBoundary());
    Status end = reader.finish();
    ASSERT_FALSE(end.ok());
    EXPECT_EQ(frameFaultOf(end.error()), FrameFault::TruncatedAtEof);
  }
}

}  // namespace
}  // namespace platform::mbx
