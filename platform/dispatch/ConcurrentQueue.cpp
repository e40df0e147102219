#include "platform/dispatch/ConcurrentQueue.h"

#include <array>
#include <string>

#include "platform/dispatch/internal/QueueFrame.h"
#include "platform/dispatch/internal/ThreadPool.h"

namespace platform::dispatch {

ConcurrentQueue::ConcurrentQueue(Priority priority)
    : Queue(std::string("qv.concurrent.") + priorityName(priority), priority) {}

std::shared_ptr<ConcurrentQueue> ConcurrentQueue::shared(Priority priority) {
  using Table = std::array<std::shared_ptr<ConcurrentQueue>, kPriorityCount>;
  // Never destroyed: work may still run on these queues while static
  // destructors run at exit.
  static Table* const queues = [] {
    auto* table = new Table();
    for (int i = 0; i < kPriorityCount; ++i) {
      (*table)[i].reset(new ConcurrentQueue(static_cast<Priority>(i)));
    }
    return table;
  }();
  return (*queues)[priorityIndex(priority)];
}

void ConcurrentQueue::async(Closure work) {
  internal::ThreadPool::instance().post(priority(), std::move(work), this);
}

void ConcurrentQueue::asyncAfterCaller(Closure work) {
  internal::ThreadPool::instance().post(priority(), std::move(work), this,
                                        internal::Handoff::CallerComesBack);
}

void ConcurrentQueue::sync(Closure work) {
  internal::ScopedQueueFrame frame(this);
  work();
}

void ConcurrentQueue::runClaimed(Closure& work) {
  internal::ScopedQueueFrame frame(this);
  work();
}

}  // namespace platform::dispatch
