#include "platform/dispatch/SerialQueue.h"

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/QueueFrame.h"
#include "platform/dispatch/internal/SyncWaiter.h"
#include "platform/dispatch/internal/ThreadPool.h"

namespace platform::dispatch {

std::shared_ptr<SerialQueue> SerialQueue::create(std::string_view label, Priority priority) {
  return std::shared_ptr<SerialQueue>(new SerialQueue(label, priority));
}

SerialQueue::SerialQueue(std::string_view label, Priority priority) : Queue(label, priority) {}

SerialQueue::~SerialQueue() = default;

void SerialQueue::async(Closure work) {
  enqueue(std::move(work), internal::Handoff::WakeIdle);
}

void SerialQueue::asyncAfterCaller(Closure work) {
  // The pool ignores the hand-off for a caller that is not one of its threads.
  enqueue(std::move(work), internal::Handoff::CallerComesBack);
}

void SerialQueue::enqueue(Closure work, internal::Handoff handoff) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    items_.push_back(Item{std::move(work), nullptr});
    if (state_ != State::Idle) return;
    state_ = State::Scheduled;
  }
  schedule(handoff);
}

void SerialQueue::schedule(internal::Handoff handoff) {
  auto self = std::static_pointer_cast<SerialQueue>(shared_from_this());
  internal::ThreadPool::instance().post(
      priority(),
      [self = std::move(self)]() mutable {
        SerialQueue* queue = self.get();
        queue->drain(std::move(self));
      },
      nullptr, handoff);
}

void SerialQueue::sync(Closure work) {
  if (isCurrent()) {
    internal::fatal("sync onto queue '%s' from work already running on it would deadlock",
                    label().c_str());
  }
  internal::SyncWaiter waiter(&work);
  bool runInline;
  {
    std::lock_guard<std::mutex> lock(mu_);
    runInline = state_ == State::Idle;
    if (runInline) {
      state_ = State::RunningInline;
    } else {
      items_.push_back(Item{Closure(), &waiter});
    }
  }

  if (!runInline) {
    waiter.wait();
    return;
  }

  {
    internal::ScopedQueueFrame frame(this);
    work();
  }
  // The caller goes on with its own work: someone else must take the turn.
  finishInline(internal::Handoff::WakeIdle);
}

bool SerialQueue::tryClaim() {
  // Exactly the test sync() makes: only an idle queue can start work on
  // the caller's thread without overtaking or overlapping anything.
  std::lock_guard<std::mutex> lock(mu_);
  if (state_ != State::Idle) return false;
  state_ = State::RunningInline;
  return true;
}

void SerialQueue::runClaimed(Closure& work) {
  {
    internal::ScopedQueueFrame frame(this);
    work();
  }
  // Only the pool's event loop claims: its thread looks for work next.
  finishInline(internal::Handoff::CallerComesBack);
}

void SerialQueue::finishInline(internal::Handoff handoff) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (items_.empty()) {
      state_ = State::Idle;
      return;
    }
    state_ = State::Scheduled;
  }
  schedule(handoff);
}

void SerialQueue::drain([[maybe_unused]] std::shared_ptr<SerialQueue> keepAlive) {
  for (int n = 0; n < kBatchLimit; ++n) {
    Item item;
    {
      std::lock_guard<std::mutex> lock(mu_);
      if (items_.empty()) {
        state_ = State::Idle;
        return;
      }
      item = std::move(items_.front());
      items_.pop_front();
      state_ = State::Draining;
    }
    runItem(item);
  }
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (items_.empty()) {
      state_ = State::Idle;
      return;
    }
    state_ = State::Scheduled;
  }
  // Back of the line at this priority: other queues get their turn first.
  // This thread comes back for the most urgent job as soon as it returns.
  schedule(internal::Handoff::CallerComesBack);
}

void SerialQueue::runItem(Item& item) {
  if (item.waiter == nullptr) {
    {
      internal::ScopedQueueFrame frame(this);
      item.work();
    }
    item.work.reset();
    return;
  }
  item.waiter->run(this);
}

std::size_t SerialQueue::pendingCountForTesting() const {
  std::lock_guard<std::mutex> lock(mu_);
  return items_.size();
}

}  // namespace platform::dispatch
