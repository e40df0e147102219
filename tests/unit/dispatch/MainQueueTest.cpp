#include "platform/dispatch/MainQueue.h"

#include <gtest/gtest.h>

#include <thread>
#include <vector>

#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

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
