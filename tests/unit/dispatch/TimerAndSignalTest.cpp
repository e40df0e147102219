#include <signal.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
#include <thread>
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

TEST(DispatchMainQueue, RunsWorkPostedBeforeTheLoopInOrderUntilQuit) {
  auto main = MainQueue::instance();
  std::vector<int> order;
  bool currentInside = false;
  bool onMainThread = false;
  main->async([&] { order.push_back(1); });
  main->async([&] {
    order.push_back(2);
    currentInside = main->isCurrent() && currentQueueLabel() == "qv.main";
  });
  // A pool thread syncs onto the main queue while the loop runs.
  auto worker = SerialQueue::create("test.main-client");
  std::thread::id loopThread = std::this_thread::get_id();
  Semaphore posted;
  worker->async([&] {
    main->sync([&] {
      order.push_back(3);
      onMainThread = std::this_thread::get_id() == loopThread && worker->isCurrent();
    });
    main->async([&] {
      order.push_back(4);
      quitMainLoop();
    });
    main->async([&] { order.push_back(5); });  // after the quit: stays queued
    posted.signal();
  });
  runMainLoop();
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3, 4}));
  EXPECT_TRUE(currentInside);
  EXPECT_TRUE(onMainThread);
  EXPECT_FALSE(main->isCurrent());

  // The item left behind runs when the loop runs again.
  ASSERT_EQ(posted.waitFor(std::chrono::seconds(5)), WaitResult::Succeeded);
  main->async([] { quitMainLoop(); });
  runMainLoop();
  EXPECT_EQ(order, (std::vector<int>{1, 2, 3, 4, 5}));
}

TEST(DispatchMainQueueDeathTest, MisuseAborts) {
  GTEST_FLAG_SET(death_test_style, "threadsafe");
  EXPECT_DEATH(
      {
        std::thread other([] { runMainLoop(); });
        other.join();
      },
      "runMainLoop\\(\\) must be called on the process's main thread");
  EXPECT_DEATH(MainQueue::instance()->sync([] {}), "from the main thread outside runMainLoop");
  EXPECT_DEATH(
      {
        MainQueue::instance()->async([] { MainQueue::instance()->sync([] {}); });
        runMainLoop();
      },
      "sync onto the main queue from work running on it would deadlock");
}

}  // namespace
}  // namespace platform::dispatch
