#include "platform/dispatch/internal/ThreadPool.h"

#include <sched.h>

#include <algorithm>
#include <string>
#include <thread>

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/QueueFrame.h"
#include "platform/dispatch/internal/Reactor.h"
#include "platform/dispatch/internal/Thread.h"

namespace platform::dispatch::internal {
namespace {

thread_local bool tOnPool = false;
thread_local int tBlockingDepth = 0;

int cpuCount() {
  cpu_set_t set;
  if (sched_getaffinity(0, sizeof set, &set) == 0) return CPU_COUNT(&set);
  return static_cast<int>(std::thread::hardware_concurrency());
}

}  // namespace

// The calling idle thread's permission to run one event handler itself.
class ThreadPool::Slot final : public RunSlot {
 public:
  explicit Slot(ThreadPool& pool) : pool_(pool) {}

  bool acquire(Priority priority) override {
    unsigned newThread;
    {
      std::lock_guard<std::mutex> lock(pool_.mu_);
      if (held_ || pool_.counts_.running >= pool_.limits_.target ||
          pool_.moreUrgentJobLocked(priority)) {
        return false;
      }
      held_ = true;
      --pool_.counts_.idle;
      ++pool_.counts_.running;
      // Jobs the wake signal was for, and events from now on, need someone
      // else: pass the signal on, or start a thread if none is left idle.
      newThread = pool_.wakeOrGrowLocked();
    }
    if (newThread != 0) pool_.startWorker(newThread);
    return true;
  }

  void release() override {
    std::lock_guard<std::mutex> lock(pool_.mu_);
    giveBackLocked();
  }

  // REQUIRES: pool_.mu_ held. Makes the thread idle again if it ran.
  bool giveBackLocked() {
    if (!held_) return false;
    held_ = false;
    --pool_.counts_.running;
    ++pool_.counts_.idle;
    return true;
  }

 private:
  ThreadPool& pool_;
  bool held_ = false;
};

ThreadPool& ThreadPool::instance() {
  // Never destroyed: pool threads may still be finishing jobs while static
  // destructors run at exit.
  static ThreadPool* const pool = new ThreadPool();
  return *pool;
}

ThreadPool::ThreadPool() {
  limits_.target = std::max(2, cpuCount());
}

bool ThreadPool::onPoolThread() {
  return tOnPool;
}

void ThreadPool::post(Priority priority, Closure job, const Queue* runAs, Handoff handoff) {
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    queues_[priorityIndex(priority)].push_back(Job{std::move(job), runAs});
    ++ready_;
    // A thread inside a blocking call does not come back when its caller
    // returns: it goes on waiting.
    const bool comesBack = tOnPool && tBlockingDepth == 0;
    newThread = wakeOrGrowLocked(comesBack ? handoff : Handoff::WakeIdle);
  }
  if (newThread != 0) startWorker(newThread);
}

void ThreadPool::keepAWaiter() {
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    newThread = wakeOrGrowLocked();
  }
  if (newThread != 0) startWorker(newThread);
}

unsigned ThreadPool::wakeOrGrowLocked(Handoff handoff) {
  // A busy serial queue going to the back of the line would otherwise wake
  // a thread that finds its own job already taken, once per batch.
  if (handoff == Handoff::WakeIdle && ready_ > 0 && counts_.running < limits_.target &&
      counts_.idle > 0 && !wakePending_) {
    wakePending_ = true;
    Reactor::instance().wakeOne();
  }
  // A thread that just started counts as idle until it takes its first job,
  // so the next call does not start another one for the same reason.
  const bool needWaiter = counts_.idle == 0;
  const bool needWorker = ready_ > static_cast<std::size_t>(counts_.idle) &&
                          counts_.running + counts_.idle < limits_.target;
  if (!needWaiter && !needWorker) return 0;
  if (counts_.threads >= limits_.cap) {
    if (ready_ > 0 && counts_.running + counts_.idle == 0) {
      fatal(
          "all %d pool threads are blocked while %zu job(s) wait to run; work that blocks "
          "on other queued work has exhausted the pool (raise the cap only if this is not "
          "a deadlock)",
          counts_.threads, ready_);
    }
    return 0;
  }
  ++counts_.threads;
  ++counts_.idle;
  return ++nextThreadNumber_;
}

void ThreadPool::startWorker(unsigned number) {
  startDetachedThread("qv-pool-" + std::to_string(number), [this] { workerMain(); });
}

bool ThreadPool::popLocked(Job& out) {
  for (int i = kPriorityCount - 1; i >= 0; --i) {
    if (!queues_[i].empty()) {
      out = std::move(queues_[i].front());
      queues_[i].pop_front();
      --ready_;
      return true;
    }
  }
  return false;
}

bool ThreadPool::moreUrgentJobLocked(Priority priority) const {
  for (int i = kPriorityCount - 1; i > priorityIndex(priority); --i) {
    if (!queues_[i].empty()) return true;
  }
  return false;
}

void ThreadPool::workerMain() {
  tOnPool = true;
  Reactor& reactor = Reactor::instance();
  Reactor::Harvest harvest;
  std::unique_lock<std::mutex> lock(mu_);
  auto idleSince = std::chrono::steady_clock::now();
  bool ranWork = false;  // idleSince is then reset from the next clock reading
  for (;;) {
    Job job;
    if (counts_.running < limits_.target && popLocked(job)) {
      --counts_.idle;
      ++counts_.running;
      unsigned newThread = wakeOrGrowLocked();
      lock.unlock();
      if (newThread != 0) startWorker(newThread);
      if (job.runAs != nullptr) {
        ScopedQueueFrame frame(job.runAs);
        job.work();
      } else {
        job.work();
      }
      // Captures die outside the lock: releasing the last reference to a
      // queue may post more work.
      job.work.reset();
      lock.lock();
      --counts_.running;
      ++counts_.idle;
      ranWork = true;
      continue;
    }
    // One clock reading per wait: it is on the path of every event.
    const auto now = std::chrono::steady_clock::now();
    if (ranWork) {
      idleSince = now;
      ranWork = false;
    }
    if (now >= idleSince + limits_.idleRetire) {
      bool canTakeWork = ready_ > 0 && counts_.running < limits_.target;
      if (!canTakeWork && counts_.threads - counts_.blocked > limits_.target && counts_.idle > 1) {
        --counts_.idle;
        --counts_.threads;
        return;
      }
      idleSince = now;
    }
    const auto timeout = idleSince + limits_.idleRetire - now;
    lock.unlock();

    reactor.wait(timeout, harvest);
    if (harvest.woken) {
      lock.lock();
      wakePending_ = false;  // taken: the jobs are ours to look at next
      lock.unlock();
    }
    Slot slot(*this);
    Closure here = reactor.deliver(harvest, &slot);
    if (here) {
      handlersRunInPlace_.fetch_add(1, std::memory_order_relaxed);
      here();
      here.reset();
    }
    lock.lock();
    if (slot.giveBackLocked()) ranWork = true;
  }
}

void ThreadPool::beginBlocking() {
  if (!tOnPool || tBlockingDepth++ > 0) return;
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    --counts_.running;
    ++counts_.blocked;
    newThread = wakeOrGrowLocked();
  }
  if (newThread != 0) startWorker(newThread);
}

void ThreadPool::endBlocking() {
  if (!tOnPool || --tBlockingDepth > 0) return;
  std::lock_guard<std::mutex> lock(mu_);
  --counts_.blocked;
  ++counts_.running;
}

PoolLimits ThreadPool::limits() const {
  std::lock_guard<std::mutex> lock(mu_);
  return limits_;
}

PoolCounts ThreadPool::counts() const {
  std::lock_guard<std::mutex> lock(mu_);
  return counts_;
}

bool ThreadPool::quietForTesting() const {
  int idle;
  {
    std::lock_guard<std::mutex> lock(mu_);
    // The caller, when it is a pool thread, is the one thread left running.
    const int self = tOnPool ? 1 : 0;
    if (ready_ > 0 || wakePending_ || counts_.running + counts_.blocked != self) return false;
    idle = counts_.idle;
  }
  // Read after mu_ is released, so that the two locks never nest.
  return Reactor::instance().pollingThreadsForTesting() == idle;
}

std::uint64_t ThreadPool::handlersRunInPlaceForTesting() const {
  return handlersRunInPlace_.load(std::memory_order_relaxed);
}

void ThreadPool::setLimitsForTesting(const PoolLimits& limits) {
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    limits_ = limits;
    newThread = wakeOrGrowLocked();
  }
  if (newThread != 0) startWorker(newThread);
  // Threads waiting for events took their retirement deadline from the old
  // limits: have them come out and look again.
  Reactor::instance().pauseForTesting();
  Reactor::instance().resumeForTesting();
}

}  // namespace platform::dispatch::internal
