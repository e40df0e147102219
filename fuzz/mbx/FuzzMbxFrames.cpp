// Arbitrary bytes as one connection's incoming stream, through the frame
// reader and the body decoder, as a connection would feed them. Checks:
//  - cutting the stream into other pieces changes nothing: the same frames,
//    then the same fault (or none) at the same point;
//  - every accepted frame obeys the rules: ids non-zero and increasing, a
//    reply names its request, nothing else does, a goodbye has no body;
//  - an accepted frame, written again with encodeFrame, reads back the same;
//  - nothing is buffered beyond what arrived.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <optional>
#include <span>
#include <vector>

#include "platform/cbor/Cbor.h"
#include "platform/mbx/FrameReader.h"
#include "platform/mbx/MbxError.h"

using namespace platform;
using namespace platform::mbx;

namespace {

struct Run {
  std::vector<Frame> frames;
  std::optional<FrameFault> fault;
};

void check(bool condition) {
  if (!condition) std::abort();
}

// Feeds `stream` in pieces whose sizes come from `cuts` (cycled).
Run feed(std::span<const std::uint8_t> stream, std::span<const std::uint8_t> cuts, bool atEnd) {
  Run run;
  FrameReader reader;
  std::size_t at = 0;
  std::size_t cut = 0;
  std::uint64_t lastId = 0;
  while (at < stream.size()) {
    std::size_t piece = stream.size() - at;
    if (!cuts.empty()) piece = std::min<std::size_t>(piece, 1 + cuts[cut++ % cuts.size()]);
    std::span<const std::uint8_t> input = stream.subspan(at, piece);
    at += piece;
    while (!input.empty()) {
      Result<std::optional<Frame>> step = reader.next(input);
      if (!step.ok()) {
        run.fault = frameFaultOf(step.error());
        check(run.fault.has_value());
        check(reader.broken());
        return run;
      }
      check(reader.bufferedBytes() <= at);
      if (!step.value()) {
        check(input.empty());
        break;
      }
      const Frame& frame = *step.value();
      check(frame.messageId > lastId);
      lastId = frame.messageId;
      check((frame.kind == FrameKind::Reply) == (frame.inReplyTo != 0));
      check((frame.kind == FrameKind::Goodbye) == frame.body.isNone());
      run.frames.push_back(std::move(*step.value()));
    }
  }
  if (atEnd) {
    const bool boundary = reader.atFrameBoundary();
    Status end = reader.finish();
    if (!end.ok()) run.fault = frameFaultOf(end.error());
    check(end.ok() == boundary);
  }
  return run;
}

bool sameFrames(const std::vector<Frame>& a, const std::vector<Frame>& b) {
  if (a.size() != b.size()) return false;
  for (std::size_t i = 0; i < a.size(); ++i) {
    if (a[i].kind != b[i].kind || a[i].messageId != b[i].messageId ||
        a[i].inReplyTo != b[i].inReplyTo || !(a[i].body == b[i].body)) {
      return false;
    }
  }
  return true;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const std::uint8_t* data, std::size_t size) {
  // The first byte picks how many of the next bytes describe the cuts.
  if (size == 0) return 0;
  const std::size_t cutCount = std::min<std::size_t>(data[0] % 8, size - 1);
  std::span<const std::uint8_t> cuts(data + 1, cutCount);
  std::span<const std::uint8_t> stream(data + 1 + cutCount, size - 1 - cutCount);

  Run whole = feed(stream, {}, true);
  Run pieces = feed(stream, cuts, true);
  check(sameFrames(whole.frames, pieces.frames));
  check(whole.fault == pieces.fault);
  const std::uint8_t single[] = {0};
  Run bytewise = feed(stream, single, true);
  check(sameFrames(whole.frames, bytewise.frames));
  check(whole.fault == bytewise.fault);

  // What was accepted, written again, reads back the same.
  std::vector<std::uint8_t> again;
  for (const Frame& frame : whole.frames) {
    Result<std::vector<std::uint8_t>> encoded = encodeFrame(frame.kind, frame.inReplyTo, frame.body);
    check(encoded.ok());
    setMessageId(encoded.value(), frame.messageId);
    again.insert(again.end(), encoded.value().begin(), encoded.value().end());
  }
  Run reread = feed(again, {}, true);
  check(!reread.fault.has_value());
  check(sameFrames(whole.frames, reread.frames));
  return 0;
}
