#include <gtest/gtest.h>

#include <atomic>
#include <condition_variable>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/internal/ThreadPool.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using internal::ThreadPool;
using testing::ScopedPoolLimits;

TEST(DispatchPool, NoDeadlockWhenMoreQueuesThanThreadsWaitOnLaterWork) {
  // Each of 3x-target queues blocks in a semaphore wait that only an item
  // queued after all of them can release.
  const int n = 3 * ThreadPool::instance().limits().target;
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
