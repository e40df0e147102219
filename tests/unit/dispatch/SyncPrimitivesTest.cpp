#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <memory>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/Group.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

TEST(DispatchSemaphore, CountsUnitsAndTimesOutWhenNoneArrive) {
  Semaphore sem(2);
  EXPECT_EQ(sem.waitFor(0ms), WaitResult::Succeeded);
  EXPECT_EQ(sem.waitFor(0ms), WaitResult::Succeeded);
  auto start = Clock::now();
  EXPECT_EQ(sem.waitFor(50ms), WaitResult::TimedOut);
  EXPECT_GE(Clock::now() - start, 50ms);
  // A timed-out wait took nothing: one signal buys exactly one wait.
  sem.signal();
  EXPECT_EQ(sem.waitFor(0ms), WaitResult::Succeeded);
  EXPECT_EQ(sem.waitFor(10ms), WaitResult::TimedOut);
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

TEST(DispatchGroup, ManualEnterLeaveAndNotifyOnAnEmptyGroup) {
  auto group = Group::create();
  auto queue = SerialQueue::create("test.group");
  Semaphore ran;
  group->notify(queue, [&] { ran.signal(); });  // empty now: posted at once
  ASSERT_EQ(ran.waitFor(5s), WaitResult::Succeeded);

  group->enter();
  group->enter();
  group->notify(queue, [&] { ran.signal(); });
  group->leave();
  EXPECT_EQ(group->waitFor(10ms), WaitResult::TimedOut);
  EXPECT_EQ(ran.waitFor(20ms), WaitResult::TimedOut);
  group->leave();
  EXPECT_EQ(group->waitFor(0ms), WaitResult::Succeeded);
  EXPECT_EQ(ran.waitFor(5s), WaitResult::Succeeded);
}

TEST(DispatchGroupDeathTest, LeaveWithoutEnterAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  auto group = Group::create();
  EXPECT_DEATH(group->leave(), "leave\\(\\) without a matching enter\\(\\)");
}

}  // namespace
}  // namespace platform::dispatch
