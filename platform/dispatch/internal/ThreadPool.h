// The one pool of threads that runs all queue work. Serial queues and the
// concurrent queues post jobs here; the pool keeps about `target` threads
// running (one per CPU) and grows past that only while some of its threads
// are blocked (see ScopedBlockingCall), so a pool full of waiting threads
// still has a thread for the work that will release them. Threads that stay
// idle for `idleRetire` retire while there are more than `target`.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <chrono>
#include <condition_variable>
#include <deque>
#include <mutex>

#include "platform/dispatch/Priority.h"
#include "platform/dispatch/internal/Closure.h"

namespace platform::dispatch {
class Queue;
}

namespace platform::dispatch::internal {

struct PoolLimits {
  int target = 2;  // threads running unblocked work at once
  int cap = 512;   // threads in all, blocked ones included
  std::chrono::milliseconds idleRetire{10'000};
};

struct PoolCounts {
  int threads = 0;  // alive, in any state
  int running = 0;  // running a job and not blocked
  int blocked = 0;  // inside a ScopedBlockingCall
  int idle = 0;     // waiting for a job (or just started)
};

class ThreadPool {
 public:
  // The process-wide pool. It is never destroyed.
  static ThreadPool& instance();

  // Queues `job` to run on a pool thread. Jobs of a higher priority start
  // first; equal priorities start in posting order. When `runAs` is not null
  // the job runs with that queue current.
  void post(Priority priority, Closure job, const Queue* runAs);

  // Called by ScopedBlockingCall. No-ops off pool threads.
  // REQUIRES: calls pair up on the same thread.
  void beginBlocking();
  void endBlocking();

  // True on the pool's own threads.
  static bool onPoolThread();

  PoolLimits limits() const;
  PoolCounts counts() const;

  // Changes the limits of the process-wide pool; existing threads adapt.
  void setLimitsForTesting(const PoolLimits& limits);

 private:
  struct Job {
    Closure work;
    const Queue* runAs;
  };

  ThreadPool();
  void workerMain();
  // Decides whether posting or blocking left ready jobs without a thread and
  // either wakes an idle one or reserves a new one. Returns the number of
  // the thread the caller must start (outside the lock), or 0.
  unsigned wakeOrGrowLocked();
  void startWorker(unsigned number);
  bool popLocked(Job& out);

  mutable std::mutex mu_;
  std::condition_variable wake_;
  std::deque<Job> queues_[kPriorityCount];
  std::size_t ready_ = 0;
  PoolLimits limits_;
  PoolCounts counts_;
  unsigned nextThreadNumber_ = 0;
};

}  // namespace platform::dispatch::internal
