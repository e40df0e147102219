#include <pthread.h>
#include <signal.h>

#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/internal/Thread.h"
#include "platform/dispatch/internal/ThreadPool.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using internal::ThreadPool;
using testing::ScopedPoolLimits;

int poolTarget() {
  return ThreadPool::instance().limits().target;
}

// Pool threads are named "qv-pool-..." and leave every signal to the signalfd.
bool isSetUpAsPoolThread() {
  sigset_t mask;
  pthread_sigmask(SIG_BLOCK, nullptr, &mask);
  return internal::currentThreadName().rfind("qv-pool-", 0) == 0 &&
         sigismember(&mask, SIGTERM) == 1 && sigismember(&mask, SIGINT) == 1 &&
         sigismember(&mask, SIGUSR1) == 1 && sigismember(&mask, SIGHUP) == 1;
}

TEST(DispatchPool, NoDeadlockWhenMoreQueuesThanThreadsWaitOnLaterWork) {
  // Each of 3x-target queues blocks in a semaphore wait that only an item
  // queued after all of them can release.
  const int n = 3 * poolTarget();
  std::vector<std::shared_ptr<SerialQueue>> waiters;
  std::vector<std::unique_ptr<Semaphore>> gates;
  Semaphore allWaiting, allDone, releaserDone;
  std::atomic<int> waiting{0};
  for (int i = 0; i < n; ++i) {
    gates.push_back(std::make_unique<Semaphore>());
    waiters.push_back(SerialQueue::create(testing::numbered("test.waiter.", i)));
    waiters.back()->async([&, gate = gates.back().get()] {
      if (waiting.fetch_add(1) + 1 == n) allWaiting.signal();
      gate->wait();
      allDone.signal();
    });
  }
  auto releaser = SerialQueue::create("test.releaser");
  releaser->async([&] {
    allWaiting.wait();
    for (auto& gate : gates) gate->signal();
    releaserDone.signal();
  });
  for (int i = 0; i < n; ++i) ASSERT_EQ(allDone.waitFor(10s), WaitResult::Succeeded) << i;
  ASSERT_EQ(releaserDone.waitFor(10s), WaitResult::Succeeded);
}

TEST(DispatchPool, NoDeadlockWhenSyncWaitersExhaustThePool) {
  // `target` is busy until an item on `opener` runs; 3x-target queues sync
  // onto it meanwhile, so every pool thread ends up waiting.
  const int n = 3 * poolTarget();
  auto target = SerialQueue::create("test.sync-target");
  auto opener = SerialQueue::create("test.opener");
  Semaphore door, allDone;
  std::atomic<int> syncsRan{0};
  target->async([&] { door.wait(); });
  std::vector<std::shared_ptr<SerialQueue>> callers;
  for (int i = 0; i < n; ++i) {
    callers.push_back(SerialQueue::create(testing::numbered("test.caller.", i)));
    callers.back()->async([&, caller = callers.back().get()] {
      target->sync([&] {
        if (caller->isCurrent()) syncsRan.fetch_add(1);
      });
      allDone.signal();
    });
  }
  ASSERT_TRUE(testing::eventually([&] { return target->pendingCountForTesting() == size_t(n); }));
  opener->async([&] { door.signal(); });
  for (int i = 0; i < n; ++i) ASSERT_EQ(allDone.waitFor(10s), WaitResult::Succeeded) << i;
  EXPECT_EQ(syncsRan.load(), n);
}

TEST(DispatchPool, ScopedBlockingCallLetsTheReleasingWorkRun) {
  // A single-thread pool: the release can only run if the waiting thread's
  // marker makes the pool start another thread.
  ScopedPoolLimits limits({.target = 1, .cap = 512, .idleRetire = 10s});
  std::mutex mu;
  std::condition_variable cv;
  bool released = false;
  Semaphore done;
  auto waiter = SerialQueue::create("test.raw-waiter");
  auto releaser = SerialQueue::create("test.raw-releaser");
  waiter->async([&] {
    {
      ScopedBlockingCall blocking;
      std::unique_lock<std::mutex> lock(mu);
      cv.wait_for(lock, 10s, [&] { return released; });
    }
    done.signal();
  });
  releaser->async([&] {
    std::lock_guard<std::mutex> lock(mu);
    released = true;
    cv.notify_all();
  });
  ASSERT_EQ(done.waitFor(20s), WaitResult::Succeeded);
  std::lock_guard<std::mutex> lock(mu);
  EXPECT_TRUE(released);
}

TEST(DispatchPool, GrownThreadsRetireWhenIdle) {
  ScopedPoolLimits limits({.target = 2, .cap = 512, .idleRetire = 100ms});
  const int n = 8;
  Semaphore gate, done;
  std::vector<std::shared_ptr<SerialQueue>> queues;
  for (int i = 0; i < n; ++i) {
    queues.push_back(SerialQueue::create(testing::numbered("test.grow.", i)));
    queues.back()->async([&] {
      gate.wait();
      done.signal();
    });
  }
  ASSERT_TRUE(testing::eventually([&] { return ThreadPool::instance().counts().blocked == n; }));
  EXPECT_GE(ThreadPool::instance().counts().threads, n);
  for (int i = 0; i < n; ++i) gate.signal();
  for (int i = 0; i < n; ++i) ASSERT_EQ(done.waitFor(5s), WaitResult::Succeeded);
  EXPECT_TRUE(testing::eventually([&] { return ThreadPool::instance().counts().threads <= 2; }))
      << ThreadPool::instance().counts().threads;
}

TEST(DispatchPool, ConcurrentQueueRunsInParallelUpToTheTargetOnSetUpPoolThreads) {
  auto queue = ConcurrentQueue::shared(Priority::Utility);
  EXPECT_EQ(queue->label(), "qv.concurrent.utility");
  constexpr int kItems = 40;
  std::atomic<int> running{0}, maxRunning{0}, notCurrent{0}, notSetUp{0};
  Semaphore done;
  for (int i = 0; i < kItems; ++i) {
    queue->async([&] {
      int now = running.fetch_add(1) + 1;
      int seen = maxRunning.load();
      while (now > seen && !maxRunning.compare_exchange_weak(seen, now)) {
      }
      if (!queue->isCurrent()) notCurrent.fetch_add(1);
      if (!isSetUpAsPoolThread()) notSetUp.fetch_add(1);
      std::this_thread::sleep_for(2ms);  // not marked: concurrency stays at target
      running.fetch_sub(1);
      done.signal();
    });
  }
  for (int i = 0; i < kItems; ++i) ASSERT_EQ(done.waitFor(10s), WaitResult::Succeeded);
  EXPECT_EQ(notCurrent.load(), 0);
  EXPECT_EQ(notSetUp.load(), 0);
  EXPECT_GE(maxRunning.load(), 2);
  EXPECT_LE(maxRunning.load(), poolTarget());

  std::thread::id ranOn;
  queue->sync([&] {
    ranOn = std::this_thread::get_id();
    EXPECT_TRUE(queue->isCurrent());
  });
  EXPECT_EQ(ranOn, std::this_thread::get_id());
}

TEST(DispatchPoolDeathTest, RunningOutOfThreadsWhileAllAreBlockedAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(
      {
        ThreadPool::instance().setLimitsForTesting({.target = 2, .cap = 4, .idleRetire = 10s});
        static Semaphore never;
        for (int i = 0; i < 6; ++i) {
          ConcurrentQueue::shared()->async([] { never.wait(); });
        }
        never.wait();  // the main thread waits too; the pool aborts first
      },
      "all 4 pool threads are blocked while [0-9]+ job\\(s\\) wait");
}

}  // namespace
}  // namespace platform::dispatch
