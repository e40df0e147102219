// Notifications through real counter files: refused names, two processes posting at once, observers seeing the last post, cancelling.
#include <gtest/gtest.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <mutex>
#include <thread>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/notify/NotifyError.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::notify {
namespace {

using namespace std::chrono_literals;

// Collects the counts an observer is given; the test thread waits on it.
class Received {
 public:
  NotificationCallback callback() {
    return [this](std::uint64_t count) {
      std::lock_guard<std::mutex> lock(mu_);
      counts_.push_back(count);
    };
  }
  // True once `count` has arrived, within a generous limit.
  bool waitFor(std::uint64_t count) {
    for (int i = 0; i < 1000; ++i, std::this_thread::sleep_for(10ms)) {
      if (!counts().empty() && counts().back() >= count) return true;
    }
    return false;
  }
  std::vector<std::uint64_t> counts() const {
    std::lock_guard<std::mutex> lock(mu_);
    return counts_;
  }

 private:
  mutable std::mutex mu_;
  std::vector<std::uint64_t> counts_;
};

class PlatformNotifyTest : public ::testing::Test {
 protected:
  services_testing::ScratchDirectory scratch_;
  const std::string directory_ = scratch_ / "run/quorvex/notify";
  std::shared_ptr<dispatch::SerialQueue> queue_ = dispatch::SerialQueue::create("notify-test");
};

TEST_F(PlatformNotifyTest, NamesThatLeaveTheDirectoryAreRefused) {
  LinuxNotificationCenter center(directory_);
  Received received;
  for (std::string_view name : {std::string_view("a/b"), std::string_view(".."),
                                std::string_view("x..y"), std::string_view("")}) {
    Status posted = center.post(name);
    ASSERT_FALSE(posted.ok()) << name;
    EXPECT_TRUE(isNotifyError(posted.error(), NotifyErrorCode::InvalidName));
    EXPECT_FALSE(center.currentCount(name).ok());
    EXPECT_FALSE(center.observe(name, queue_, received.callback()).ok());
  }
  EXPECT_FALSE(center.post(std::string(256, 'n')).ok());
  EXPECT_TRUE(center.post(std::string(255, 'n')).ok());
}

TEST_F(PlatformNotifyTest, TwoProcessesPostingAddUpAndTheObserverSeesTheLast) {
  constexpr int kPostsEach = 1000;
  constexpr std::uint64_t kTotal = 2 * kPostsEach + 1;
  LinuxNotificationCenter center(directory_);
  ASSERT_TRUE(center.post("shared").ok());  // before observing: not delivered
  Received received;
  auto observation = center.observe("shared", queue_, received.callback());
  ASSERT_TRUE(observation.ok()) << observation.error().description();
  int start[2];
  ASSERT_EQ(::pipe(start), 0);
  const pid_t child = ::fork();
  ASSERT_GE(child, 0);
  if (child == 0) {
    // Its own center: a poster needs no queue and no watcher.
    char go;
    if (::read(start[0], &go, 1) != 1) ::_exit(2);
    LinuxNotificationCenter poster(directory_);
    for (int i = 0; i < kPostsEach; ++i) {
      if (!poster.post("shared").ok()) ::_exit(1);
    }
    ::_exit(0);
  }
  ::close(start[0]);
  ASSERT_EQ(::write(start[1], "g", 1), 1);  // both start posting now
  ::close(start[1]);
  for (int i = 0; i < kPostsEach; ++i) ASSERT_TRUE(center.post("shared").ok());
  int status = 0;
  ASSERT_EQ(::waitpid(child, &status, 0), child);
  ASSERT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  EXPECT_EQ(center.currentCount("shared").valueOr(0), kTotal);
  ASSERT_TRUE(received.waitFor(kTotal));
  std::vector<std::uint64_t> counts = received.counts();
  EXPECT_EQ(counts.back(), kTotal);
  EXPECT_GT(counts.front(), 1u);
  for (std::size_t i = 1; i < counts.size(); ++i) EXPECT_LT(counts[i - 1], counts[i]);
  // Quiet afterwards: nothing more arrives without another post.
  std::this_thread::sleep_for(50ms);
  queue_->sync([] {});
  EXPECT_EQ(received.counts().size(), counts.size());
}

TEST_F(PlatformNotifyTest, CancelledObserversAndThoseOfADestroyedCenterAreNotCalled) {
  Received cancelled, orphaned, witness;
  ObservationHandle orphan;
  {
    LinuxNotificationCenter gone(directory_);
    auto observation = gone.observe("n", queue_, orphaned.callback());
    ASSERT_TRUE(observation.ok());
    orphan = std::move(observation).value();
  }
  LinuxNotificationCenter center(directory_);
  auto first = center.observe("n", queue_, cancelled.callback());
  auto second = center.observe("n", queue_, witness.callback());
  ASSERT_TRUE(first.ok() && second.ok());
  first->cancel();
  EXPECT_FALSE(first->isActive());
  // Once the witness has seen the second post, the watcher is done with the
  // first, and a sync drains anything it sent to the shared queue.
  ASSERT_TRUE(center.post("n").ok());
  ASSERT_TRUE(witness.waitFor(1));
  ASSERT_TRUE(center.post("n").ok());
  ASSERT_TRUE(witness.waitFor(2));
  queue_->sync([] {});
  EXPECT_TRUE(cancelled.counts().empty());
  EXPECT_TRUE(orphaned.counts().empty());
  orphan.cancel();  // after its center: harmless
}

}  // namespace
}  // namespace platform::notify
