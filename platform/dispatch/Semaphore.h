// A counting semaphore. wait() takes one unit, blocking while there is none;
// signal() adds one and wakes a waiter. Waiting is marked as blocking, so a
// pool thread waiting here lets the pool run the work that will signal.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <mutex>

#include "platform/dispatch/WaitResult.h"

namespace platform::dispatch {

class Semaphore {
 public:
  // REQUIRES: initial >= 0.
  explicit Semaphore(std::int64_t initial = 0);
  // REQUIRES: no thread is waiting.
  ~Semaphore();

  Semaphore(const Semaphore&) = delete;
  Semaphore& operator=(const Semaphore&) = delete;

  void signal();

  // Takes a unit, waiting as long as it takes.
  void wait();

  // Takes a unit if one becomes available within `timeout`.
  [[nodiscard]] WaitResult waitFor(std::chrono::nanoseconds timeout);

 private:
  std::mutex mu_;
  std::condition_variable cv_;
  std::int64_t count_;
  int waiters_ = 0;
};

}  // namespace platform::dispatch
