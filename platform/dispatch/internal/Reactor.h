// The one thread ("qv-reactor") that waits for file descriptors and timers.
// It owns an epoll set; event sources register their fds in it and are told
// when they are ready, on this thread, so they can post their handlers to
// their queues. When several sources are ready in the same wakeup they are
// told in priority order (then oldest first). It also keeps the deadlines
// of after() on one timerfd. The thread starts on first use.
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

// What the reactor tells about readiness.
class ReadyTarget {
 public:
  virtual ~ReadyTarget() = default;
  // Called on the reactor thread: keep it short and never block.
  virtual void onReady() = 0;
};

class Reactor {
 public:
  // The process-wide reactor; starts its thread on first call. Never destroyed.
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

  // Holds the reactor thread between two wakeups until resumeForTesting(),
  // so that a test can make several sources ready "at the same moment".
  void pauseForTesting();
  void resumeForTesting();

  // Ready events taken from the kernel per wakeup.
  static constexpr int kMaxEventsPerWakeup = 256;

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
  void threadMain();
  void deliver(const epoll_event* events, int count);
  void fireDueTimers();
  void armTimerFdLocked();
  void honourPause();

  int epollFd_ = -1;
  int wakeFd_ = -1;   // eventfd: interrupts epoll_wait
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
  bool paused_ = false;
};

}  // namespace platform::dispatch::internal
