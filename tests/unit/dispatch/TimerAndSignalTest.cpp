#include <signal.h>
#include <unistd.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <vector>

#include "platform/dispatch/MainQueue.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/SignalSource.h"
#include "platform/dispatch/TimerSource.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;

TEST(DispatchTimer, OneShotFiresOnceAfterItsDelayRepeatingTicksUntilCancelled) {
  auto queue = SerialQueue::create("test.timer");
  std::atomic<int> fired{0};
  std::atomic<bool> onQueue{false};
  Semaphore tick, cancelled;
  auto timer = TimerSource::create("test.once", Priority::Default, queue, [&] {
    onQueue = queue->isCurrent();
    fired.fetch_add(1);
    tick.signal();
  });
  ASSERT_TRUE(timer.ok()) << timer.message();
  auto start = Clock::now();
  timer.value()->scheduleOnce(40ms);
  timer.value()->resume();
  ASSERT_EQ(tick.waitFor(5s), WaitResult::Succeeded);
  EXPECT_GE(Clock::now() - start, 40ms);
  EXPECT_TRUE(onQueue);
  std::this_thread::sleep_for(100ms);
  EXPECT_EQ(fired.load(), 1);

  // Re-scheduling a fired one-shot timer makes it fire again.
  timer.value()->scheduleOnce(1ms);
  ASSERT_EQ(tick.waitFor(5s), WaitResult::Succeeded);

  timer.value()->setCancelHandler([&] { cancelled.signal(); });
  timer.value()->scheduleRepeating(5ms, 5ms);
  ASSERT_TRUE(testing::eventually([&] { return fired >= 6; }));
  timer.value()->cancel();
  ASSERT_EQ(cancelled.waitFor(5s), WaitResult::Succeeded);
  int atCancel = fired.load();
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(fired.load(), atCancel);
  timer.value()->scheduleOnce(1ms);  // after cancel: ignored, no crash
  std::this_thread::sleep_for(20ms);
  EXPECT_EQ(fired.load(), atCancel);
}

TEST(DispatchTimer, AfterPostsWorkInDeadlineOrder) {
  auto queue = SerialQueue::create("test.after");
  std::vector<int> order;  // touched only on the queue
  Semaphore done;
  auto start = Clock::now();
  Clock::duration firstAt{};
  for (int delayMs : {60, 20, 40}) {
    after(std::chrono::milliseconds(delayMs), queue, [&, delayMs] {
      if (order.empty()) firstAt = Clock::now() - start;
      order.push_back(delayMs);
      done.signal();
    });
  }
  for (int i = 0; i < 3; ++i) ASSERT_EQ(done.waitFor(5s), WaitResult::Succeeded);
  queue->sync([&] {
    EXPECT_THAT(order, ::testing::ElementsAre(20, 40, 60));
    EXPECT_GE(firstAt, 20ms);
  });
}

TEST(DispatchSignalSource, DeliversARealSignalToTheMainQueue) {
  std::atomic<int> received{0};
  bool onMain = false;
  auto source = SignalSource::create("test.usr1", SIGUSR1, Priority::UserInteractive,
                                     MainQueue::instance(), [&] {
                                       onMain = MainQueue::instance()->isCurrent();
                                       if (received.fetch_add(1) + 1 == 2) quitMainLoop();
                                     });
  ASSERT_TRUE(source.ok()) << source.message();
  EXPECT_EQ(source.value()->signal(), SIGUSR1);
  source.value()->resume();
  // Sent to the process, not a thread: only the signalfd may take it.
  ASSERT_EQ(kill(getpid(), SIGUSR1), 0);
  auto sender = SerialQueue::create("test.sender");
  sender->async([] {
    std::this_thread::sleep_for(20ms);
    kill(getpid(), SIGUSR1);
  });
  runMainLoop();
  EXPECT_EQ(received.load(), 2);
  EXPECT_TRUE(onMain);
  source.value()->cancel();

  EXPECT_FALSE(
      SignalSource::create("test.kill", SIGKILL, Priority::Default, MainQueue::instance(), [] {
      }).ok());
}

}  // namespace
}  // namespace platform::dispatch
