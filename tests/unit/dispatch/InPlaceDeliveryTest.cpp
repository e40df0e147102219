// Event handlers run by the pool thread that took the event: they must
// still be items of their queue (exclusion, order, isCurrent), fall back to
// posting when the queue is busy, and no event may be lost while the
// thread waiting for events changes.
#include <sys/eventfd.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/internal/ThreadPool.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using internal::ThreadPool;

// An eventfd watched by a source; closed once the source is cancelled.
struct Counter {
  Counter() : fd(eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC)) {}
  void bump(eventfd_t n = 1) const { ASSERT_EQ(eventfd_write(fd, n), 0); }
  eventfd_t take() const {
    eventfd_t value = 0;
    return eventfd_read(fd, &value) == 0 ? value : 0;
  }
  int fd;
};

std::shared_ptr<FdSource> watch(const Counter& counter, std::shared_ptr<Queue> queue,
                                Closure handler) {
  auto result = FdSource::create("test.inplace", Priority::Default, counter.fd,
                                 FdSource::Event::Readable, std::move(queue), std::move(handler));
  EXPECT_TRUE(result.ok()) << result.message();
  if (!result.ok()) return nullptr;
  result.value()->resume();
  return std::move(result).value();
}

void finish(const std::shared_ptr<FdSource>& source) {
  int fd = source->fd();
  EXPECT_TRUE(testing::cancelAndWait(source, [fd] { close(fd); }));
}

// Counts how many work items of one queue run at once.
struct Exclusion {
  void enter() {
    if (inside.fetch_add(1) != 0) overlapped = true;
  }
  void leave() { inside.fetch_sub(1); }
  std::atomic<int> inside{0};
  std::atomic<bool> overlapped{false};
};

TEST(DispatchInPlaceDelivery, AHandlerRunInPlaceIsAnItemOfItsQueue) {
  auto queue = SerialQueue::create("test.inplace.queue");
  Counter counter;
  Exclusion exclusion;
  Semaphore entered, release, done;
  std::atomic<bool> current{false}, onPool{false};
  const auto before = ThreadPool::instance().handlersRunInPlaceForTesting();
  auto source = watch(counter, queue, [&] {
    exclusion.enter();
    current = queue->isCurrent();
    onPool = ThreadPool::onPoolThread();
    counter.take();
    entered.signal();
    release.wait();
    exclusion.leave();
    done.signal();
  });
  ASSERT_TRUE(source);
  counter.bump();
  ASSERT_EQ(entered.waitFor(5s), WaitResult::Succeeded);
  // The queue is idle, so the thread that took the event ran the handler.
  EXPECT_EQ(ThreadPool::instance().handlersRunInPlaceForTesting(), before + 1);
  EXPECT_TRUE(current);
  EXPECT_TRUE(onPool);

  // While it holds the queue, neither an async item nor a sync may start.
  std::atomic<bool> asyncRan{false}, syncRan{false};
  queue->async([&] {
    exclusion.enter();
    asyncRan = true;
    exclusion.leave();
  });
  std::thread syncCaller([&] {
    queue->sync([&] {
      exclusion.enter();
      syncRan = true;
      exclusion.leave();
    });
  });
  std::this_thread::sleep_for(50ms);
  EXPECT_FALSE(asyncRan);
  EXPECT_FALSE(syncRan);
  release.signal();
  ASSERT_EQ(done.waitFor(5s), WaitResult::Succeeded);
  syncCaller.join();
  queue->sync([] {});
  EXPECT_TRUE(asyncRan);
  EXPECT_TRUE(syncRan);
  EXPECT_FALSE(exclusion.overlapped);
  finish(source);
}

TEST(DispatchInPlaceDelivery, EventsAreSeenWhileTheOnlyRunningThreadBlocksInAHandler) {
  // One running thread at most: the handler of `waiting` blocks (marked)
  // until the handler of `releasing` runs, which needs someone else to be
  // waiting for events while the first thread sits in its handler.
  testing::ScopedPoolLimits limits({.target = 1, .cap = 512, .idleRetire = 10s});
  Counter waitingFd, releasingFd;
  Semaphore inside, released, done;
  auto waiting = watch(waitingFd, SerialQueue::create("test.inplace.waiting"), [&] {
    waitingFd.take();
    inside.signal();
    EXPECT_EQ(released.waitFor(10s), WaitResult::Succeeded);
    done.signal();
  });
  auto releasing = watch(releasingFd, SerialQueue::create("test.inplace.releasing"), [&] {
    releasingFd.take();
    released.signal();
  });
  ASSERT_TRUE(waiting && releasing);
  for (int round = 0; round < 20; ++round) {
    waitingFd.bump();
    ASSERT_EQ(inside.waitFor(5s), WaitResult::Succeeded) << round;
    releasingFd.bump();
    ASSERT_EQ(done.waitFor(15s), WaitResult::Succeeded) << round;
  }
  finish(waiting);
  finish(releasing);
}

void expectEveryEventCounted(int target) {
  testing::ScopedPoolLimits limits({.target = target, .cap = 512, .idleRetire = 10s});
  constexpr int kSources = 8;
  constexpr int kWritesPerWriter = 4000;
  std::vector<std::shared_ptr<SerialQueue>> queues;
  std::vector<std::unique_ptr<Exclusion>> exclusions;
  for (int i = 0; i < kSources / 2; ++i) {
    queues.push_back(SerialQueue::create(testing::numbered("test.inplace.count.", i)));
    exclusions.push_back(std::make_unique<Exclusion>());
  }
  std::vector<Counter> counters(kSources);
  std::atomic<long> counted{0};
  std::vector<std::shared_ptr<FdSource>> sources;
  for (int i = 0; i < kSources; ++i) {
    Exclusion* exclusion = exclusions[i % queues.size()].get();
    const Counter* counter = &counters[i];
    sources.push_back(watch(counters[i], queues[i % queues.size()], [=, &counted] {
      exclusion->enter();
      counted.fetch_add(static_cast<long>(counter->take()));
      exclusion->leave();
    }));
    ASSERT_TRUE(sources.back());
  }
  // Two writers spread their writes over every source while handlers run,
  // so events keep arriving while the waiting thread changes hands.
  auto writer = [&](int offset) {
    for (int n = 0; n < kWritesPerWriter; ++n) counters[(n + offset) % kSources].bump();
  };
  std::thread w1(writer, 0), w2(writer, 3);
  w1.join();
  w2.join();
  ASSERT_TRUE(testing::eventually([&] { return counted == 2 * kWritesPerWriter; }, 10s))
      << counted.load() << " of " << 2 * kWritesPerWriter;
  for (auto& exclusion : exclusions) EXPECT_FALSE(exclusion->overlapped);
  for (auto& source : sources) finish(source);
}

TEST(DispatchInPlaceDelivery, NoEventIsLostWhileTheWaitingThreadChanges) {
  expectEveryEventCounted(1);
  expectEveryEventCounted(ThreadPool::instance().limits().target);
}

}  // namespace
}  // namespace platform::dispatch
