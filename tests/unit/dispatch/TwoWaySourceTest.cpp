// One source watching both directions of a socket, and what handlers may
// tell the source about the fd (Drained or MayRemain) under edge-triggered
// watching.
#include <sys/socket.h>
#include <unistd.h>

#include <gtest/gtest.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <thread>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "tests/unit/dispatch/TestSupport.h"

namespace platform::dispatch {
namespace {

using namespace std::chrono_literals;
using Readiness = FdSource::Readiness;

// A connected pair of non-blocking stream sockets: `near` is watched.
struct SocketPair {
  SocketPair() {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0, fds) != 0) std::abort();
    near = fds[0];
    far = fds[1];
  }
  ~SocketPair() {
    if (near >= 0) close(near);
    if (far >= 0) close(far);
  }
  // Cancels the source watching `near`; closes `near` in its cancel handler.
  void finish(const std::shared_ptr<FdSource>& source) {
    int fd = near;
    near = -1;
    EXPECT_TRUE(testing::cancelAndWait(source, [fd] { close(fd); }));
  }
  void send(int fd, const std::string& bytes) const {
    ASSERT_EQ(::send(fd, bytes.data(), bytes.size(), MSG_NOSIGNAL), ssize_t(bytes.size()));
  }
  // Reads what is there, until EAGAIN or EOF.
  static void readAll(int fd, std::string* into) {
    char buf[4096];
    for (ssize_t n; (n = ::recv(fd, buf, sizeof buf, MSG_DONTWAIT)) > 0;) into->append(buf, size_t(n));
  }
  // Fills `fd`'s send buffer until the kernel refuses more.
  static void fill(int fd) {
    std::string block(65536, 'x');
    while (::send(fd, block.data(), block.size(), MSG_DONTWAIT | MSG_NOSIGNAL) > 0) {
    }
  }
  int near;
  int far;
};

std::shared_ptr<FdSource> twoWay(int fd, std::shared_ptr<Queue> queue, FdSource::Handler onRead,
                                 FdSource::Handler onWrite) {
  auto result = FdSource::createTwoWay("test.twoway", Priority::Default, fd, std::move(queue),
                                       std::move(onRead), std::move(onWrite));
  EXPECT_TRUE(result.ok()) << result.message();
  return result.ok() ? std::move(result).value() : nullptr;
}

TEST(DispatchTwoWaySource, EachDirectionHasItsHandlerAndItsOwnSuspension) {
  // On the concurrent queue the two handlers could overlap if the source
  // let them.
  SocketPair pair;
  std::atomic<int> inside{0}, reads{0}, writes{0};
  std::atomic<bool> overlapped{false};
  std::mutex receivedMu;
  std::string received;  // guarded by receivedMu
  Semaphore readDone, writeDone;
  std::shared_ptr<FdSource> source;
  auto enter = [&] {
    if (inside.fetch_add(1) != 0) overlapped = true;
    std::this_thread::sleep_for(2ms);  // widen the window for an overlap
  };
  const int near = pair.near;
  source = twoWay(
      near, ConcurrentQueue::shared(),
      [&, near] {
        enter();
        {
          std::lock_guard<std::mutex> lock(receivedMu);
          SocketPair::readAll(near, &received);
        }
        reads.fetch_add(1);
        inside.fetch_sub(1);
        readDone.signal();
        return Readiness::Drained;
      },
      [&] {
        enter();
        writes.fetch_add(1);
        source->suspend(FdSource::Event::Writable);  // done writing
        inside.fetch_sub(1);
        writeDone.signal();
        return Readiness::Drained;
      });
  ASSERT_TRUE(source);

  // Reads only at first; then a full socket is not writable: no write
  // handler until the far side reads.
  source->resume(FdSource::Event::Readable);
  pair.send(pair.far, "ping");
  ASSERT_EQ(readDone.waitFor(5s), WaitResult::Succeeded);
  SocketPair::fill(pair.near);
  source->resume(FdSource::Event::Writable);
  EXPECT_EQ(writeDone.waitFor(100ms), WaitResult::TimedOut);
  EXPECT_EQ(writes.load(), 0);
  std::string sink;
  SocketPair::readAll(pair.far, &sink);
  ASSERT_EQ(writeDone.waitFor(5s), WaitResult::Succeeded);
  EXPECT_EQ(writes.load(), 1);

  // Both directions ready at once, many times: never two handlers at once.
  for (int i = 0; i < 20; ++i) {
    source->resume(FdSource::Event::Writable);
    pair.send(pair.far, "x");
    ASSERT_EQ(writeDone.waitFor(5s), WaitResult::Succeeded);
    ASSERT_EQ(readDone.waitFor(5s), WaitResult::Succeeded);
  }
  EXPECT_FALSE(overlapped);
  {
    std::lock_guard<std::mutex> lock(receivedMu);  // not held across cancel()
    EXPECT_EQ(received, "ping" + std::string(20, 'x'));
  }
  int fd = pair.near;
  pair.near = -1;
  EXPECT_TRUE(testing::cancelAndWait(source, [&, fd] {
    EXPECT_EQ(inside.load(), 0);  // after the last handler, not beside it
    close(fd);
  }));
}

TEST(DispatchTwoWaySource, LeftoverDataIsReportedAgainUnlessTheHandlerDrainedIt) {
  // One byte per call, admitting that more may remain: every byte comes.
  // Reading until EAGAIN and saying so: one call per arrival, no extra checks.
  for (Readiness says : {Readiness::MayRemain, Readiness::Drained}) {
    const bool drains = says == Readiness::Drained;
    SCOPED_TRACE(drains ? "Drained" : "MayRemain");
    SocketPair pair;
    auto queue = SerialQueue::create("test.twoway.level");
    std::atomic<int> calls{0};
    std::string received;  // touched on the queue only
    const int near = pair.near;
    auto source = twoWay(
        near, queue,
        [&, near, says, drains] {
          if (drains) {
            SocketPair::readAll(near, &received);
          } else {
            char byte;
            if (::recv(near, &byte, 1, MSG_DONTWAIT) == 1) received += byte;
          }
          calls.fetch_add(1);
          return says;
        },
        nullptr);
    ASSERT_TRUE(source);
    source->resume();
    pair.send(pair.far, "abc");
    ASSERT_TRUE(testing::eventually([&] { return calls >= (drains ? 1 : 3); }));
    pair.send(pair.far, "de");
    ASSERT_TRUE(testing::eventually([&] { return calls >= (drains ? 2 : 5); }));
    std::this_thread::sleep_for(50ms);
    if (drains) {
      EXPECT_EQ(calls.load(), 2);
    }
    queue->sync([&] { EXPECT_EQ(received, "abcde"); });
    pair.finish(source);
  }
}

TEST(DispatchTwoWaySource, AHangupThatCameWithTheLastDataIsStillReported) {
  // The peer writes and closes before anyone looks: one edge carries both.
  // A short read takes the data; the end must still reach the handler.
  SocketPair pair;
  auto queue = SerialQueue::create("test.twoway.hangup");
  std::string received;
  std::atomic<bool> sawEnd{false};
  const int near = pair.near;
  auto source = twoWay(
      near, queue,
      [&, near] {
        char buf[4096];
        ssize_t n = ::recv(near, buf, sizeof buf, MSG_DONTWAIT);
        if (n > 0) received.append(buf, size_t(n));
        if (n == 0) sawEnd = true;
        // A short read is as good as EAGAIN for a stream socket.
        return Readiness::Drained;
      },
      nullptr);
  ASSERT_TRUE(source);
  pair.send(pair.far, "last words");
  close(pair.far);
  pair.far = -1;
  source->resume();
  ASSERT_TRUE(testing::eventually([&] { return sawEnd.load(); }));
  pair.finish(source);
  queue->sync([&] { EXPECT_EQ(received, "last words"); });
}

TEST(DispatchTwoWaySource, ReadinessNotedWhileSuspendedIsCheckedAgainOnResume) {
  // Someone else reads while the source is suspended (as a synchronous
  // waiter does): resuming must not deliver for data that is gone, and
  // must deliver for data that is still there.
  SocketPair pair;
  auto queue = SerialQueue::create("test.twoway.stale");
  std::atomic<int> calls{0};
  std::string received;
  const int near = pair.near;
  auto source = twoWay(
      near, queue,
      [&, near] {
        SocketPair::readAll(near, &received);
        calls.fetch_add(1);
        return Readiness::Drained;
      },
      nullptr);
  ASSERT_TRUE(source);
  source->resume();
  source->suspend(FdSource::Event::Readable);
  pair.send(pair.far, "taken elsewhere");
  std::string elsewhere;
  ASSERT_TRUE(testing::eventually([&] {
    SocketPair::readAll(pair.near, &elsewhere);
    return elsewhere == "taken elsewhere";
  }));
  source->resume(FdSource::Event::Readable);
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(calls.load(), 0);

  source->suspend(FdSource::Event::Readable);
  pair.send(pair.far, "kept");
  std::this_thread::sleep_for(20ms);
  EXPECT_EQ(calls.load(), 0);
  source->resume(FdSource::Event::Readable);
  ASSERT_TRUE(testing::eventually([&] { return calls == 1; }));
  queue->sync([&] { EXPECT_EQ(received, "kept"); });
  pair.finish(source);
}

}  // namespace
}  // namespace platform::dispatch
