#include "platform/dispatch/internal/ThreadPool.h"

#include <sched.h>

#include <algorithm>
#include <string>
#include <thread>

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/QueueFrame.h"
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

void ThreadPool::post(Priority priority, Closure job, const Queue* runAs) {
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    queues_[priorityIndex(priority)].push_back(Job{std::move(job), runAs});
    ++ready_;
    newThread = wakeOrGrowLocked();
  }
  if (newThread != 0) startWorker(newThread);
}

unsigned ThreadPool::wakeOrGrowLocked() {
  if (ready_ == 0) return 0;
  // Enough threads are at work; when one of them blocks or finishes it
  // comes back here or takes the next job itself.
  if (counts_.running >= limits_.target) return 0;
  if (counts_.idle > 0) wake_.notify_one();
  if (ready_ <= static_cast<std::size_t>(counts_.idle)) return 0;
  if (counts_.running + counts_.idle >= limits_.target) return 0;
  if (counts_.threads >= limits_.cap) {
    if (counts_.running + counts_.idle == 0) {
      fatal(
          "all %d pool threads are blocked while %zu job(s) wait to run; work that blocks "
          "on other queued work has exhausted the pool (raise the cap only if this is not "
          "a deadlock)",
          counts_.threads, ready_);
    }
    return 0;
  }
  // The new thread counts as idle until it takes its first job, so the next
  // post does not start another one for the same job.
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

void ThreadPool::workerMain() {
  tOnPool = true;
  std::unique_lock<std::mutex> lock(mu_);
  auto idleSince = std::chrono::steady_clock::now();
  for (;;) {
    Job job;
    if (counts_.running < limits_.target && popLocked(job)) {
      --counts_.idle;
      ++counts_.running;
      lock.unlock();
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
      idleSince = std::chrono::steady_clock::now();
      continue;
    }
    auto deadline = idleSince + limits_.idleRetire;
    if (wake_.wait_until(lock, deadline) == std::cv_status::timeout &&
        std::chrono::steady_clock::now() >= idleSince + limits_.idleRetire) {
      bool canTakeWork = ready_ > 0 && counts_.running < limits_.target;
      if (!canTakeWork && counts_.threads - counts_.blocked > limits_.target) {
        --counts_.idle;
        --counts_.threads;
        return;
      }
      idleSince = std::chrono::steady_clock::now();
    }
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

void ThreadPool::setLimitsForTesting(const PoolLimits& limits) {
  unsigned newThread;
  {
    std::lock_guard<std::mutex> lock(mu_);
    limits_ = limits;
    wake_.notify_all();
    newThread = wakeOrGrowLocked();
  }
  if (newThread != 0) startWorker(newThread);
}

}  // namespace platform::dispatch::internal
