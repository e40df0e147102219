// The epoll set behind every event source, and the deadlines of after().
// It owns no thread: idle pool threads wait in it (see ThreadPool), so the
// thread that takes an event can often run the handler itself instead of
// handing it to another thread. Sources register their fds here and are
// told when they are ready; sources ready in the same wakeup are told in
// priority order (then oldest first). The pool's own wake-up signal for
// posted work travels through the same set, so an idle thread waits for
// work and for events in one place.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <sys/epoll.h>

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <unordered_map>
#include <vector>

#include "platform/dispatch/Priority.h"
#include "platform/dispatch/internal/Closure.h"

namespace platform::dispatch {
class Queue;
}

namespace platform::dispatch::internal {

// Lets a ready target run its handler on the pool thread that took the
// event, when the pool can spare that thread for it.
class RunSlot {
 public:
  virtual ~RunSlot() = default;
  // True when the calling thread may run one handler of `priority` now:
  // the pool is below its target and no more urgent job is waiting. Once
  // granted, the thread counts as running until the pool's loop resumes.
  virtual bool acquire(Priority priority) = 0;
  // Hands back a slot acquired but not used.
  virtual void release() = 0;
};

// What the reactor tells about readiness.
class ReadyTarget {
 public:
  virtual ~ReadyTarget() = default;
  // Called on the thread that took the event, with the epoll bits. When
  // `slot` is not null the target may acquire it and return work the caller
  // runs right after every other target of the wakeup has been told;
  // otherwise it posts its handler and returns an empty Closure. Keep it
  // short and never block.
  virtual Closure onReady(std::uint32_t events, RunSlot* slot) = 0;
};

class Reactor {
 public:
  // The process-wide reactor. Never destroyed.
  static Reactor& instance();

  // Makes `target` known under a new key; the reactor holds it until remove().
  std::uint64_t add(std::shared_ptr<ReadyTarget> target, Priority priority);
  // After remove() returns, `key` is not told about again except by a
  // wakeup already in progress.
  void remove(std::uint64_t key);

  // The epoll_ctl operations on the reactor's set, `data` being the key.
  // Each answers 0 or an errno.
  int watch(int fd, std::uint64_t key, std::uint32_t events);
  int modify(int fd, std::uint64_t key, std::uint32_t events);
  int unwatch(int fd);

  // Posts `work` to `queue` once `delay` has passed.
  void after(std::chrono::nanoseconds delay, std::shared_ptr<Queue> queue, Closure work);

  // Ready events taken from the kernel per wakeup.
  static constexpr int kMaxEventsPerWakeup = 64;

  struct Ready {
    Priority priority;
    std::uint64_t key;
    std::uint32_t events;
    std::shared_ptr<ReadyTarget> target;
  };
  // One wakeup's worth of events, sorted for delivery.
  struct Harvest {
    bool polled = false;  // wait() entered the kernel; deliver() must follow
    bool woken = false;   // wakeOne() was among the events
    bool timers = false;  // an after() deadline may have passed
    int count = 0;
    Ready ready[kMaxEventsPerWakeup];
  };

  // Waits for events for up to `timeout` and fills `out`. Returns at once,
  // with nothing, while paused. REQUIRES: deliver(out) is called next.
  void wait(std::chrono::steady_clock::duration timeout, Harvest& out);
  // Tells the harvested targets, in order, and fires due after() work.
  // Returns the handler work one of them claimed for the calling thread
  // through `slot` (at most one), to be run by the caller.
  Closure deliver(Harvest& harvest, RunSlot* slot);

  // Makes one thread waiting in wait() return with `woken` set (or the next
  // one to call it, if none waits). Used by the pool for posted work.
  void wakeOne();

  // Keeps every thread out of wait() until resumeForTesting(), and returns
  // once none is inside, so that a test can make several sources ready "at
  // the same moment". Also used to make waiting threads notice new limits.
  void pauseForTesting();
  void resumeForTesting();
  // Threads inside wait() (or delivering what it returned) right now.
  int pollingThreadsForTesting();

 private:
  struct Entry {
    std::shared_ptr<ReadyTarget> target;
    Priority priority;
  };
  struct Timer {
    std::chrono::steady_clock::time_point deadline;
    std::uint64_t sequence;  // keeps equal deadlines in posting order
    std::shared_ptr<Queue> queue;
    Closure work;
  };

  Reactor();
  void fireDueTimers();
  void armTimerFdLocked();
  void leavePoll();

  int epollFd_ = -1;
  int wakeFd_ = -1;   // eventfd, edge-triggered: one signal wakes one waiter
  int kickFd_ = -1;   // eventfd, level-triggered: every waiter returns
  int timerFd_ = -1;  // timerfd: the earliest after() deadline

  std::mutex entriesMu_;
  std::unordered_map<std::uint64_t, Entry> entries_;
  std::uint64_t nextKey_;

  std::mutex timersMu_;
  std::vector<Timer> timers_;  // a min-heap on (deadline, sequence)
  std::uint64_t nextSequence_ = 0;

  std::mutex pauseMu_;
  std::condition_variable pauseCv_;
  bool pauseRequested_ = false;
  int activePolls_ = 0;  // threads between entering wait() and leaving deliver()
};

}  // namespace platform::dispatch::internal
