#include "platform/dispatch/FdSource.h"

#include <fcntl.h>
#include <sys/eventfd.h>
#include <unistd.h>

#include <gmock/gmock.h>
#include <gtest/gtest.h>

#include <atomic>
#include <cerrno>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <vector>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/dispatch/internal/Reactor.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using ::testing::ElementsAre;

struct Pipe {
  Pipe() {
    int fds[2];
    if (pipe2(fds, O_NONBLOCK | O_CLOEXEC) != 0) std::abort();
    readEnd = fds[0];
    writeEnd = fds[1];
  }
  ~Pipe() {
    if (readEnd >= 0) close(readEnd);
    close(writeEnd);
  }
  void put(const char* bytes) const { ASSERT_GT(write(writeEnd, bytes, strlen(bytes)), 0); }
  int readEnd;
  int writeEnd;
};

std::shared_ptr<FdSource> watch(int fd, std::shared_ptr<Queue> queue, Closure handler,
                                Priority priority = Priority::Default) {
  auto result = FdSource::create("test.source", priority, fd, FdSource::Event::Readable,
                                 std::move(queue), std::move(handler));
  EXPECT_TRUE(result.ok()) << result.message();
  return result.ok() ? std::move(result).value() : nullptr;
}

void drain(int fd) {
  char buf[64];
  while (read(fd, buf, sizeof buf) > 0) {
  }
}

TEST(DispatchFdSource, NeverDeliversTwiceWhileAHandlerIsPendingOrRunning) {
  // On the concurrent queue a duplicate delivery would run in parallel.
  Pipe pipe;
  std::atomic<int> calls{0}, inside{0}, maxInside{0};
  auto source = watch(pipe.readEnd, ConcurrentQueue::shared(), [&] {
    int now = inside.fetch_add(1) + 1;
    if (now > maxInside) maxInside = now;
    calls.fetch_add(1);
    std::this_thread::sleep_for(30ms);  // still readable all this time
    char byte;
    (void)read(pipe.readEnd, &byte, 1);  // one byte per delivery
    inside.fetch_sub(1);
  });
  ASSERT_TRUE(source);
  source->resume();
  pipe.put("x");
  ASSERT_TRUE(testing::eventually([&] { return calls == 1; }));
  std::this_thread::sleep_for(100ms);
  EXPECT_EQ(calls.load(), 1);
  // Level-triggered: three bytes read one per delivery take three more.
  pipe.put("yzw");
  ASSERT_TRUE(testing::eventually([&] { return calls == 4; }));
  std::this_thread::sleep_for(100ms);
  EXPECT_EQ(calls.load(), 4);
  EXPECT_EQ(maxInside.load(), 1);
  source->cancel();
}

TEST(DispatchFdSource, CancelHandlerRunsOnceAfterTheLastEventHandler) {
  // On the concurrent queue, nothing but the source itself keeps the cancel
  // handler from overtaking a running event handler.
  Pipe pipe;
  auto queue = ConcurrentQueue::shared();
  std::mutex mu;
  std::vector<std::string> log;
  Semaphore entered, gate, cancelled;
  auto append = [&](const char* entry) {
    std::lock_guard<std::mutex> lock(mu);
    log.push_back(entry);
  };
  auto source = watch(pipe.readEnd, queue, [&] {
    entered.signal();
    gate.wait();
    append("event");
  });
  ASSERT_TRUE(source);
  source->setCancelHandler([&] {
    append(queue->isCurrent() ? "cancel" : "cancel-off-queue");
    EXPECT_EQ(close(pipe.readEnd), 0);  // the owner may close the fd now
    pipe.readEnd = -1;
    cancelled.signal();
  });
  source->resume();
  pipe.put("a");
  ASSERT_EQ(entered.waitFor(5s), WaitResult::Succeeded);
  source->cancel();
  source->cancel();
  EXPECT_EQ(cancelled.waitFor(50ms), WaitResult::TimedOut);  // the handler still runs
  gate.signal();
  ASSERT_EQ(cancelled.waitFor(5s), WaitResult::Succeeded);
  EXPECT_EQ(cancelled.waitFor(50ms), WaitResult::TimedOut);  // once only
  {
    std::lock_guard<std::mutex> lock(mu);
    EXPECT_THAT(log, ElementsAre("event", "cancel"));
  }
}

TEST(DispatchFdSource, RefusesWhatEpollCannotWatch) {
  auto queue = SerialQueue::create("test.bad");
  auto bad =
      FdSource::create("test.bad", Priority::Default, -1, FdSource::Event::Readable, queue, [] {});
  EXPECT_EQ(bad.error(), EBADF);
  EXPECT_THAT(bad.message(), ::testing::HasSubstr("epoll_ctl"));
  FILE* file = tmpfile();
  ASSERT_NE(file, nullptr);
  EXPECT_EQ(FdSource::create("test.file", Priority::Default, fileno(file),
                             FdSource::Event::Readable, queue, [] {})
                .error(),
            EPERM);
  fclose(file);
}

TEST(DispatchFdSource, SourcesReadyTogetherAreDeliveredInPriorityOrder) {
  const Priority priorities[] = {Priority::Default, Priority::UserInteractive, Priority::Background,
                                 Priority::UserInteractive, Priority::Utility};
  auto queue = SerialQueue::create("test.order");
  std::vector<int> order;  // touched only on the queue
  Semaphore delivered;
  std::vector<int> fds;
  std::vector<std::shared_ptr<FdSource>> sources;
  for (int i = 0; i < 5; ++i) {
    int fd = eventfd(0, EFD_NONBLOCK | EFD_CLOEXEC);
    fds.push_back(fd);
    sources.push_back(watch(
        fd, queue,
        [&, fd, i] {
          drain(fd);
          order.push_back(i);
          delivered.signal();
        },
        priorities[i]));
    ASSERT_TRUE(sources.back());
    sources.back()->resume();
  }
  // Hold the reactor so that all five become ready within one wakeup.
  internal::Reactor::instance().pauseForTesting();
  for (int fd : fds) ASSERT_EQ(eventfd_write(fd, 1), 0);
  internal::Reactor::instance().resumeForTesting();
  for (int i = 0; i < 5; ++i) ASSERT_EQ(delivered.waitFor(5s), WaitResult::Succeeded);
  // Highest priority first; equal priorities in creation order.
  queue->sync([&] { EXPECT_THAT(order, ElementsAre(1, 3, 0, 4, 2)); });
  for (auto& s : sources) s->cancel();
  queue->sync([] {});  // the cancels ran: the fds are unwatched
  for (int fd : fds) close(fd);
}

}  // namespace
}  // namespace platform::dispatch
