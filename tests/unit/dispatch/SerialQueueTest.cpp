#include "platform/dispatch/SerialQueue.h"

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/Group.h"
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
  std::atomic<bool> overlapped{false}, outOfOrder{false};
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

TEST(DispatchGroup, WaitAndNotifyComeAfterEveryTask) {
  auto group = Group::create();
  auto notifyQueue = SerialQueue::create("test.notify");
  constexpr int kTasks = 50;
  std::atomic<int> finished{0};
  std::atomic<int> finishedAtNotify{-1};
  std::atomic<bool> notifyOnQueue{false};
  Semaphore notified;
  Semaphore gate;
  for (int i = 0; i < kTasks; ++i) {
    group->async(ConcurrentQueue::shared(), [&, i] {
      if (i == 0) gate.wait();  // holds the group open until we say so
      finished.fetch_add(1);
    });
  }
  group->notify(notifyQueue, [&] {
    finishedAtNotify = finished.load();
    notifyOnQueue = notifyQueue->isCurrent();
    notified.signal();
  });
  EXPECT_EQ(group->waitFor(30ms), WaitResult::TimedOut);
  EXPECT_EQ(notified.waitFor(0ms), WaitResult::TimedOut);
  gate.signal();
  group->wait();
  EXPECT_EQ(finished.load(), kTasks);
  ASSERT_EQ(notified.waitFor(5s), WaitResult::Succeeded);
  EXPECT_EQ(finishedAtNotify.load(), kTasks);
  EXPECT_TRUE(notifyOnQueue);
}

TEST(DispatchGroupDeathTest, LeaveWithoutEnterAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  auto group = Group::create();
  EXPECT_DEATH(group->leave(), "leave\\(\\) without a matching enter\\(\\)");
}

}  // namespace
}  // namespace platform::dispatch
