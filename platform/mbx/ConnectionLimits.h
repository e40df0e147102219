// The bounds every connection keeps, so that no peer can make the process
// buffer, wait or decode without end. Defaults suit the daemon; tests lower
// them to reach the edges quickly.
//
// Thread safety: a plain value.
#pragma once

#include <cstddef>

#include "platform/mbx/FrameReader.h"

namespace platform::mbx {

struct ConnectionLimits {
  // Output queued for a peer that does not read; past it the connection is
  // closed with a logged reason.
  std::size_t maxQueuedOutputBytes = 32u << 20;
  // Requests awaiting replies on one connection; past it sendWithReply fails
  // at once (TooManyPendingReplies) and the connection stays up.
  std::size_t maxPendingReplies = 4096;
  // Body size, nesting and item count of incoming frames.
  FrameLimits frame;
  // Socket reads (of up to kReadChunkBytes) per turn on the delivery queue
  // before the connection lets others run.
  int maxReadsPerTurn = 4;

  static constexpr std::size_t kReadChunkBytes = 64u << 10;
};

}  // namespace platform::mbx
