// Marks a call that may block the calling thread for an unbounded time
// (fsync, a blocking read, waiting for a semaphore or for other queued
// work). On a pool thread the pool then counts the thread as blocked and, if
// work is waiting, wakes or starts another thread, so blocking can never
// starve the work that would unblock it. Elsewhere it does nothing.
//
//   {
//     platform::dispatch::ScopedBlockingCall blocking;
//     ::fsync(fd);
//   }
//
// Thread safety: an instance belongs to the thread that created it and must
// be destroyed on that thread; instances may nest.
#pragma once

namespace platform::dispatch {

class ScopedBlockingCall {
 public:
  ScopedBlockingCall();
  ~ScopedBlockingCall();

  ScopedBlockingCall(const ScopedBlockingCall&) = delete;
  ScopedBlockingCall& operator=(const ScopedBlockingCall&) = delete;
};

}  // namespace platform::dispatch
