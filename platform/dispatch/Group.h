// Tracks a set of outstanding tasks and tells when all have finished.
// enter() and leave() bracket a task; async() does both around a work item.
// wait() blocks until the count is zero (marked as blocking); notify()
// posts work to a queue once it is.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <chrono>
#include <condition_variable>
#include <cstdint>
#include <memory>
#include <mutex>
#include <utility>
#include <vector>

#include "platform/dispatch/Queue.h"
#include "platform/dispatch/WaitResult.h"

namespace platform::dispatch {

class Group : public std::enable_shared_from_this<Group> {
 public:
  static std::shared_ptr<Group> create();

  Group(const Group&) = delete;
  Group& operator=(const Group&) = delete;

  void enter();
  // REQUIRES: matches an earlier enter() (an unmatched leave aborts).
  void leave();

  // Runs `work` on `queue` as a task of this group. The group stays alive
  // until the work has run.
  void async(const std::shared_ptr<Queue>& queue, Closure work);

  // Posts `work` to `queue` once the group is empty: at once if it is empty
  // now, otherwise when the last outstanding task leaves.
  void notify(std::shared_ptr<Queue> queue, Closure work);

  // Blocks until the group is empty.
  void wait();
  // Blocks until the group is empty or `timeout` has passed.
  [[nodiscard]] WaitResult waitFor(std::chrono::nanoseconds timeout);

 private:
  Group() = default;

  std::mutex mu_;
  std::condition_variable emptied_;
  std::int64_t count_ = 0;
  std::vector<std::pair<std::shared_ptr<Queue>, Closure>> notifications_;
};

}  // namespace platform::dispatch
