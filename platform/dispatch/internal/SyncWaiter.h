// A sync caller waiting for another thread to run its work. It lives on the
// caller's stack; the runner touches it only until it marks it done.
//
// Thread safety: run() is called by exactly one thread, wait() by the owner.
#pragma once

#include <condition_variable>
#include <mutex>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/internal/Closure.h"
#include "platform/dispatch/internal/QueueFrame.h"

namespace platform::dispatch::internal {

class SyncWaiter {
 public:
  // Captures the caller's chain of current queues.
  explicit SyncWaiter(Closure* work) : work_(work), chain_(currentFrame()) {}

  SyncWaiter(const SyncWaiter&) = delete;
  SyncWaiter& operator=(const SyncWaiter&) = delete;

  // Runs the work with `queue` current on top of the caller's chain, then
  // releases the caller. `this` may be gone when run() returns.
  void run(const Queue* queue) {
    {
      // The caller is blocked, so its frames do not change while we run.
      ScopedQueueFrame frame(queue, chain_);
      (*work_)();
    }
    // Notify under the lock: once the caller sees `done_` it returns and
    // this object is destroyed.
    std::lock_guard<std::mutex> lock(mu_);
    done_ = true;
    cv_.notify_one();
  }

  // Blocks, marked as blocking, until run() has finished.
  void wait() {
    ScopedBlockingCall blocking;
    std::unique_lock<std::mutex> lock(mu_);
    cv_.wait(lock, [this] { return done_; });
  }

 private:
  Closure* const work_;
  const QueueFrame* const chain_;
  std::mutex mu_;
  std::condition_variable cv_;
  bool done_ = false;
};

}  // namespace platform::dispatch::internal
