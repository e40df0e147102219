#include "platform/dispatch/SerialQueue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "platform/dispatch/Semaphore.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using testing::ScopedPoolLimits;

TEST(DispatchSerialQueue, KeepsSubmissionOrderAndExclusionUnderContention) {
  auto queue = SerialQueue::create("test.order");
  constexpr int kProducers = 4;
  constexpr int kPerProducer = 3000;
  std::vector<int> lastSeen(kProducers, -1);  // touched only on the queue
  std::atomic<int> inside{0};
  std::atomic<bool> overlapped{false};
  std::atomic<bool> outOfOrder{false};
  Semaphore done;

  std::vector<std::thread> producers;
  for (int p = 0; p < kProducers; ++p) {
    producers.emplace_back([&, p] {
      for (int i = 0; i < kPerProducer; ++i) {
        queue->async([&, p, i] {
          if (inside.fetch_add(1) != 0) overlapped = true;
          if (lastSeen[p] != i - 1) outOfOrder = true;
          lastSeen[p] = i;
          inside.fetch_sub(1);
          if (p == 0 && i == kPerProducer - 1) done.signal();
        });
      }
    });
  }
  for (auto& t : producers) t.join();
  queue->async([&] { done.signal(); });
  ASSERT_EQ(done.waitFor(10s), WaitResult::Succeeded);
  ASSERT_EQ(done.waitFor(10s), WaitResult::Succeeded);
  EXPECT_FALSE(overlapped);
  EXPECT_FALSE(outOfOrder);
  for (int p = 0; p < kProducers; ++p) EXPECT_EQ(lastSeen[p], kPerProducer - 1);
}

TEST(DispatchSerialQueue, BusyQueueYieldsToOthersAfterABatch) {
  // One pool thread: only yielding lets the second queue in before the
  // first has drained its whole backlog.
  ScopedPoolLimits limits({.target = 1, .cap = 512, .idleRetire = 10s});
  auto busy = SerialQueue::create("test.busy");
  auto other = SerialQueue::create("test.other");
  constexpr int kBacklog = 2000;
  std::atomic<int> busyRan{0};
  std::atomic<int> busyRanWhenOtherRan{-1};
  std::atomic<bool> release{false};
  Semaphore done, otherDone;
  // Spins rather than waits: a wait marked as blocking would let the pool
  // start a second thread and hide the yielding.
  busy->async([&] {
    while (!release) std::this_thread::yield();
  });
  for (int i = 0; i < kBacklog; ++i) {
    busy->async([&] {
      if (busyRan.fetch_add(1) + 1 == kBacklog) done.signal();
    });
  }
  other->async([&] {
    busyRanWhenOtherRan = busyRan.load();
    otherDone.signal();
  });
  release = true;
  ASSERT_EQ(done.waitFor(10s), WaitResult::Succeeded);
  ASSERT_EQ(otherDone.waitFor(10s), WaitResult::Succeeded);
  EXPECT_GE(busyRanWhenOtherRan.load(), 0);
  EXPECT_LE(busyRanWhenOtherRan.load(), 2 * SerialQueue::kBatchLimit);
}

TEST(DispatchSerialQueue, HigherPriorityQueuesGetThePoolFirst) {
  ScopedPoolLimits limits({.target = 1, .cap = 512, .idleRetire = 10s});
  auto blocker = SerialQueue::create("test.blocker");
  auto low = SerialQueue::create("test.low", Priority::Background);
  auto mid = SerialQueue::create("test.mid", Priority::Default);
  auto high = SerialQueue::create("test.high", Priority::UserInteractive);
  std::vector<std::string> order;  // appended to by one pool thread at a time
  std::mutex mu;
  std::atomic<bool> release{false};
  Semaphore started, done;
  // Occupies the only running slot without being marked as blocking.
  blocker->async([&] {
    started.signal();
    while (!release) std::this_thread::yield();
  });
  ASSERT_EQ(started.waitFor(5s), WaitResult::Succeeded);
  auto record = [&](const char* name) {
    return [&, name] {
      bool last;
      {
        std::lock_guard<std::mutex> lock(mu);
        order.push_back(name);
        last = order.size() == 3;
      }
      if (last) done.signal();  // after unlocking: the test may end at once
    };
  };
  low->async(record("low"));
  mid->async(record("mid"));
  high->async(record("high"));
  release = true;
  ASSERT_EQ(done.waitFor(5s), WaitResult::Succeeded);
  EXPECT_THAT(order, ::testing::ElementsAre("high", "mid", "low"));
}

TEST(DispatchSerialQueue, SyncRunsInlineWhenIdleAndHopsBehindPendingWorkKeepingTheChainCurrent) {
  auto a = SerialQueue::create("test.a");
  auto b = SerialQueue::create("test.b");
  auto c = SerialQueue::create("test.c");
  auto unrelated = SerialQueue::create("test.unrelated");
  const std::thread::id caller = std::this_thread::get_id();
  std::thread::id inlineOn, hopOn;
  bool inlineChain = false;
  bool hopChain = false;
  std::vector<int> order;  // touched only on b
  Semaphore started, gate;
  a->sync([&] {
    b->sync([&] {
      c->sync([&] {
        inlineOn = std::this_thread::get_id();
        inlineChain = a->isCurrent() && b->isCurrent() && c->isCurrent() &&
                      !unrelated->isCurrent() && currentQueueLabel() == "test.c";
      });
    });
    // Make b busy so the next sync waits behind items 1 and 2 on a pool thread.
    b->async([&] {
      started.signal();
      gate.wait();
      order.push_back(1);
    });
    b->async([&] { order.push_back(2); });
    ASSERT_EQ(started.waitFor(5s), WaitResult::Succeeded);
    std::thread releaser([&] {
      testing::eventually([&] { return b->pendingCountForTesting() == 2; });
      gate.signal();
    });
    b->sync([&] {
      order.push_back(3);
      hopOn = std::this_thread::get_id();
      hopChain = a->isCurrent() && b->isCurrent() && !c->isCurrent();
    });
    releaser.join();
  });
  EXPECT_EQ(inlineOn, caller);
  EXPECT_TRUE(inlineChain);
  EXPECT_NE(hopOn, caller);
  EXPECT_TRUE(hopChain);
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3}));
  EXPECT_FALSE(a->isCurrent());
  EXPECT_EQ(currentQueueLabel(), "");
}

TEST(DispatchSerialQueue, PendingWorkKeepsTheQueueAlive) {
  auto queue = SerialQueue::create("test.alive");
  std::weak_ptr<SerialQueue> weak = queue;
  Semaphore gate, ran;
  queue->async([&] { gate.wait(); });
  queue->async([&] { ran.signal(); });
  queue.reset();
  EXPECT_FALSE(weak.expired());
  gate.signal();
  ASSERT_EQ(ran.waitFor(5s), WaitResult::Succeeded);
  EXPECT_TRUE(testing::eventually([&] { return weak.expired(); }));
}

TEST(DispatchSerialQueueDeathTest, SyncOntoTheCurrentChainAndWrongQueueAssertsAbort) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  auto a = SerialQueue::create("test.self");
  EXPECT_DEATH(a->sync([&] { a->sync([] {}); }), "sync onto queue 'test.self'.*deadlock");
  auto b = SerialQueue::create("test.other");
  EXPECT_DEATH(a->sync([&] { b->sync([&] { a->sync([] {}); }); }),
               "sync onto queue 'test.self'.*deadlock");

  // QV_ASSERT_ON_QUEUE names the expected and the actual queue.
  auto expected = SerialQueue::create("test.expected");
  auto actual = SerialQueue::create("test.actual");
  actual->sync([&] { QV_ASSERT_ON_QUEUE(actual); });  // passes
  EXPECT_DEATH(actual->sync([&] { QV_ASSERT_ON_QUEUE(expected); }),
               "expected to run on queue 'test.expected' but running on 'test.actual'");
  EXPECT_DEATH(expected->assertCurrent(), "'test.expected' but running on no queue");
}

}  // namespace
}  // namespace platform::dispatch
