#include "platform/dispatch/MainQueue.h"

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/QueueFrame.h"
#include "platform/dispatch/internal/SyncWaiter.h"
#include "platform/dispatch/internal/Thread.h"

namespace platform::dispatch {

std::shared_ptr<MainQueue> MainQueue::instance() {
  // Never destroyed: other threads may post to it while the process exits.
  static auto* const queue = new std::shared_ptr<MainQueue>(new MainQueue());
  return *queue;
}

MainQueue::MainQueue() : Queue("qv.main", Priority::UserInteractive) {}

void MainQueue::async(Closure work) {
  std::lock_guard<std::mutex> lock(mu_);
  items_.push_back(Item{std::move(work), nullptr});
  cv_.notify_one();
}

void MainQueue::sync(Closure work) {
  if (isCurrent()) {
    internal::fatal("sync onto the main queue from work running on it would deadlock");
  }
  internal::SyncWaiter waiter(&work);
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (internal::isProcessMainThread()) {
      internal::fatal(
          "sync onto the main queue from the main thread outside runMainLoop() "
          "would wait forever");
    }
    items_.push_back(Item{Closure(), &waiter});
    cv_.notify_one();
  }
  waiter.wait();
}

void MainQueue::run() {
  if (!internal::isProcessMainThread()) {
    internal::fatal("runMainLoop() must be called on the process's main thread");
  }
  std::unique_lock<std::mutex> lock(mu_);
  if (running_) internal::fatal("runMainLoop() called from inside the main loop");
  running_ = true;
  while (!quitRequested_) {
    if (items_.empty()) {
      cv_.wait(lock);
      continue;
    }
    Item item = std::move(items_.front());
    items_.pop_front();
    lock.unlock();
    if (item.waiter != nullptr) {
      item.waiter->run(this);
    } else {
      {
        internal::ScopedQueueFrame frame(this);
        item.work();
      }
      item.work.reset();
    }
    lock.lock();
  }
  quitRequested_ = false;
  running_ = false;
}

void MainQueue::quit() {
  std::lock_guard<std::mutex> lock(mu_);
  quitRequested_ = true;
  cv_.notify_one();
}

void runMainLoop() {
  MainQueue::instance()->run();
}

void quitMainLoop() {
  MainQueue::instance()->quit();
}

}  // namespace platform::dispatch
