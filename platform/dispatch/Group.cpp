#include "platform/dispatch/Group.h"

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/internal/Fatal.h"

namespace platform::dispatch {

std::shared_ptr<Group> Group::create() {
  return std::shared_ptr<Group>(new Group());
}

void Group::enter() {
  std::lock_guard<std::mutex> lock(mu_);
  ++count_;
}

void Group::leave() {
  std::vector<std::pair<std::shared_ptr<Queue>, Closure>> ready;
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (count_ == 0) internal::fatal("Group::leave() without a matching enter()");
    if (--count_ > 0) return;
    ready.swap(notifications_);
    emptied_.notify_all();
  }
  for (auto& [queue, work] : ready) queue->async(std::move(work));
}

void Group::async(const std::shared_ptr<Queue>& queue, Closure work) {
  enter();
  queue->async([self = shared_from_this(), work = std::move(work)]() mutable {
    work();
    // Whatever the work captured is released before the group can be seen
    // empty, so a waiter may tear down what it shared with the tasks.
    work.reset();
    self->leave();
  });
}

void Group::notify(std::shared_ptr<Queue> queue, Closure work) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (count_ > 0) {
      notifications_.emplace_back(std::move(queue), std::move(work));
      return;
    }
  }
  queue->async(std::move(work));
}

void Group::wait() {
  std::unique_lock<std::mutex> lock(mu_);
  if (count_ == 0) return;
  lock.unlock();
  ScopedBlockingCall blocking;
  lock.lock();
  emptied_.wait(lock, [this] { return count_ == 0; });
}

WaitResult Group::waitFor(std::chrono::nanoseconds timeout) {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  std::unique_lock<std::mutex> lock(mu_);
  if (count_ == 0) return WaitResult::Succeeded;
  lock.unlock();
  ScopedBlockingCall blocking;
  lock.lock();
  return emptied_.wait_until(lock, deadline, [this] { return count_ == 0; }) ? WaitResult::Succeeded
                                                                             : WaitResult::TimedOut;
}

}  // namespace platform::dispatch
