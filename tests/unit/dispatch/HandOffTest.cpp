// asyncAfterCaller: work handed on at the end of a job waits for the
// posting thread instead of waking another, and still runs whenever that
// thread will not come back soon.
#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <thread>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/internal/ThreadPool.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using testing::eventually;

// Runs `post` as a job of a fresh serial queue that then works on for a
// moment, and answers whether the work it handed on ran on that job's
// thread. The job posts only once every other thread of the pool is back
// waiting for events, so that on a loaded machine a thread that is still
// on its way back from an earlier round cannot take the work: only a
// thread woken for it can, and it would take it during that moment.
template <typename Post>
bool ranOnThePostingThread(Post post) {
  auto from = SerialQueue::create("handoff.from");
  auto to = SerialQueue::create("handoff.to");
  std::thread::id poster;
  std::thread::id runner;
  Semaphore done;
  from->async([&] {
    poster = std::this_thread::get_id();
    EXPECT_TRUE(eventually([] { return internal::ThreadPool::instance().quietForTesting(); }));
    post(*to, [&] {
      runner = std::this_thread::get_id();
      done.signal();
    });
    const auto until = std::chrono::steady_clock::now() + 2ms;
    while (std::chrono::steady_clock::now() < until) {
    }
  });
  EXPECT_EQ(done.waitFor(10s), WaitResult::Succeeded);
  return poster == runner;
}

TEST(DispatchHandOff, TheCallersThreadTakesTheWorkOnceItsJobReturns) {
  // A thread whose idle wait times out may take the work first, so the
  // check is on the share of rounds, not on every one. With async() instead
  // a woken thread wins nearly every round.
  int same = 0;
  for (int round = 0; round < 100; ++round) {
    same += ranOnThePostingThread(
        [](Queue& to, Closure work) { to.asyncAfterCaller(std::move(work)); });
  }
  EXPECT_GE(same, 90);

  // The concurrent queues hand off the same way.
  same = 0;
  for (int round = 0; round < 100; ++round) {
    same += ranOnThePostingThread(
        [](Queue&, Closure work) { ConcurrentQueue::shared()->asyncAfterCaller(std::move(work)); });
  }
  EXPECT_GE(same, 90);
}

TEST(DispatchHandOff, WorkRunsWhenThePosterDoesNotComeBack) {
  // Off the pool: nobody would come back, so a thread is woken.
  auto queue = SerialQueue::create("handoff.offpool");
  std::atomic<bool> ran{false};
  queue->asyncAfterCaller([&] { ran = true; });
  EXPECT_TRUE(eventually([&] { return ran.load(); }));

  // The poster then blocks waiting for the work: the pool must wake a
  // thread for it, or this job waits for ever.
  Semaphore outer;
  queue->async([&] {
    Semaphore inner;
    ConcurrentQueue::shared()->asyncAfterCaller([&] { inner.signal(); });
    EXPECT_EQ(inner.waitFor(10s), WaitResult::Succeeded);
    outer.signal();
  });
  EXPECT_EQ(outer.waitFor(20s), WaitResult::Succeeded);

  // Handed on from inside a blocking call, which does not return to the
  // pool when the caller's code does: it must not wait for this thread.
  Semaphore blocked;
  queue->async([&] {
    ScopedBlockingCall blocking;
    std::atomic<bool> handedOnRan{false};
    ConcurrentQueue::shared()->asyncAfterCaller([&] { handedOnRan = true; });
    EXPECT_TRUE(eventually([&] { return handedOnRan.load(); }));
    blocked.signal();
  });
  EXPECT_EQ(blocked.waitFor(20s), WaitResult::Succeeded);
}

}  // namespace
}  // namespace platform::dispatch
