// One case per framing rule, broken: the bytes a peer sends and the fault
// they must produce. The reader tests feed them directly; the socket tests
// send them from another process.
#pragma once

#include <vector>

#include "platform/mbx/MbxError.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace platform::mbx::testing {

// A frame whose length field matches `body`, whatever else it says.
inline Bytes withBody(const Bytes& body, std::uint16_t flags, std::uint64_t id,
                      std::uint64_t inReplyTo = 0) {
  return rawFrame(header(flags, id, static_cast<std::uint32_t>(body.size()), inReplyTo), body);
}

struct FaultCase {
  const char* name;
  Bytes bytes;
  FrameFault fault;
  bool atEndOfStream = false;  // the fault shows only when the stream ends
};

inline std::vector<FaultCase> frameFaultCases() {
  const Bytes map = cborOf(Dictionary{{"k", 1}});
  const Bytes first = frameBytes(FrameKind::Message, 5, Dictionary{{"seq", 0}});
  FrameHeader v2 = header(0, 1, static_cast<std::uint32_t>(map.size()));
  v2.version = 2;
  return {
      {"another protocol, seen at four bytes", {'G', 'E', 'T', ' '}, FrameFault::BadMagic},
      {"version 2", rawFrame(v2, map), FrameFault::UnknownVersion},
      {"unknown flag 0x8000", withBody(map, 0x8000, 1), FrameFault::UnknownFlags},
      {"goodbye expecting a reply", withBody({}, 0x5, 1), FrameFault::ConflictingFlags},
      {"zero message id", withBody(map, 0, 0), FrameFault::ZeroMessageId},
      {"repeated message id", concat({first, first}), FrameFault::NonIncreasingMessageId},
      {"body length over 16 MiB", rawFrame(header(0, 1, kMaxBodyBytes + 1), {}),
       FrameFault::BodyTooLarge},
      {"goodbye with a body", withBody(map, kFlagGoodbye, 1), FrameFault::GoodbyeWithBody},
      {"reply to request 0", withBody(map, kFlagReply, 1), FrameFault::ReplyWithoutRequestId},
      {"in-reply-to on a message", withBody(map, 0, 1, 9), FrameFault::RequestIdWithoutReply},
      {"truncated body at EOF", rawFrame(header(0, 1, 100), Bytes(10, 0x61)),
       FrameFault::TruncatedAtEof, true},
      {"empty body", withBody({}, 0, 1), FrameFault::UndecodableBody},
      {"trailing bytes", withBody(concat({map, {0x00}}), 0, 1), FrameFault::UndecodableBody},
      {"nesting over 64", withBody(concat({Bytes(65, 0x81), {0x01}}), 0, 1),
       FrameFault::UndecodableBody},
  };
}

}  // namespace platform::mbx::testing
