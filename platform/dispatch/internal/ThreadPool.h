// The one pool of threads that runs all queue work and waits for all
// events. Serial queues and the concurrent queues post jobs here; the pool
// keeps about `target` threads running (one per CPU) and grows past that
// only while some of its threads are blocked (see ScopedBlockingCall), so a
// pool full of waiting threads still has a thread for the work that will
// release them.
//
// Idle threads wait in the reactor (epoll), not on a condition variable,
// and the pool always keeps one idle thread (starting one when the last
// goes to work), so events are seen while every other thread is busy. The
// thread that takes an event may run its handler itself (see RunSlot):
// no hand-off to another thread. Posted work wakes one idle thread through
// the reactor. Threads that stay idle for `idleRetire` retire while more
// than `target` are not blocked, the last idle one excepted.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
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

// Who will start a posted job.
enum class Handoff {
  WakeIdle,         // an idle thread, woken for it
  CallerComesBack,  // the posting pool thread, which is about to end its job
};

struct PoolCounts {
  int threads = 0;  // alive, in any state
  int running = 0;  // running a job or a handler, and not blocked
  int blocked = 0;  // inside a ScopedBlockingCall
  int idle = 0;     // waiting for a job or an event (or just started)
};

class ThreadPool {
 public:
  // The process-wide pool. It is never destroyed.
  static ThreadPool& instance();

  // Queues `job` to run on a pool thread. Jobs of a higher priority start
  // first; equal priorities start in posting order. When `runAs` is not null
  // the job runs with that queue current. With Handoff::CallerComesBack no
  // thread is woken: the caller's thread takes the most urgent job next and
  // wakes others for what is left.
  // REQUIRES: for CallerComesBack, the caller is a pool thread whose job (or
  //           handler) returns right after this call.
  void post(Priority priority, Closure job, const Queue* runAs,
            Handoff handoff = Handoff::WakeIdle);

  // Called by ScopedBlockingCall. No-ops off pool threads.
  // REQUIRES: calls pair up on the same thread.
  void beginBlocking();
  void endBlocking();

  // Starts a thread if none is idle, so that someone waits for events.
  // Called when the first sources and deadlines appear.
  void keepAWaiter();

  // True on the pool's own threads.
  static bool onPoolThread();

  PoolLimits limits() const;
  PoolCounts counts() const;

  // Changes the limits of the process-wide pool; existing threads adapt.
  void setLimitsForTesting(const PoolLimits& limits);
  // True while no job waits, no wake signal is on its way and every thread
  // but the caller is idle and back in the reactor: the moment from which a
  // thread starts work only if something wakes it.
  bool quietForTesting() const;
  // Event handlers run by the thread that took the event, since start.
  std::uint64_t handlersRunInPlaceForTesting() const;

 private:
  struct Job {
    Closure work;
    const Queue* runAs;
  };
  class Slot;

  ThreadPool();
  void workerMain();
  // Wakes an idle thread for ready jobs, and decides whether a thread must
  // be started: for jobs no idle thread will take, or because none is left
  // idle to wait for events. Returns the number of the thread the caller
  // must start (outside the lock), or 0.
  unsigned wakeOrGrowLocked(Handoff handoff = Handoff::WakeIdle);
  void startWorker(unsigned number);
  bool popLocked(Job& out);
  bool moreUrgentJobLocked(Priority priority) const;

  mutable std::mutex mu_;
  std::deque<Job> queues_[kPriorityCount];
  std::size_t ready_ = 0;
  PoolLimits limits_;
  PoolCounts counts_;
  unsigned nextThreadNumber_ = 0;
  // A wake signal is on its way to an idle thread. One at a time: whoever
  // takes it takes a job and passes the signal on if more are waiting.
  bool wakePending_ = false;
  std::atomic<std::uint64_t> handlersRunInPlace_{0};
};

}  // namespace platform::dispatch::internal
