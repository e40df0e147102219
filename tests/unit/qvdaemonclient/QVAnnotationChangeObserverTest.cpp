// The annotation-change observer over the in-memory center and the real one.
#include <gtest/gtest.h>

#include <mutex>

#include "Quorvex/QVAnnotationChangeObserver.h"
#include "Quorvex/QVDConstants.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/notify/testing/FakeNotificationCenter.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace {

using platform::mbx::testing::eventually;

struct Counts {
  std::mutex mu;
  std::vector<std::uint64_t> seen;
  QVAnnotationChangeObserver::Callback callback() {
    return [this](std::uint64_t count) {
      std::lock_guard<std::mutex> lock(mu);
      seen.push_back(count);
    };
  }
  std::vector<std::uint64_t> get() {
    std::lock_guard<std::mutex> lock(mu);
    return seen;
  }
};

TEST(QVAnnotationChangeObserver, SeesOnlyItsNotificationUntilCancelled) {
  auto center = std::make_shared<platform::notify::FakeNotificationCenter>();
  auto queue = platform::dispatch::SerialQueue::create("test.observer");
  Counts counts;
  auto observer = QVAnnotationChangeObserver::start(center, queue, counts.callback());
  ASSERT_TRUE(observer.ok());
  ASSERT_TRUE(center->post(QVNotifyAnnotationChange).ok());
  ASSERT_TRUE(center->post("com.corvane.quorvex.something-else").ok());
  ASSERT_TRUE(center->post(QVNotifyAnnotationChange).ok());
  EXPECT_EQ(counts.get(), (std::vector<std::uint64_t>{1, 2}));

  queue->sync([&] { observer.value()->cancel(); });
  EXPECT_FALSE(observer.value()->isActive());
  EXPECT_EQ(center->observerCountForTesting(QVNotifyAnnotationChange), 0u);
  ASSERT_TRUE(center->post(QVNotifyAnnotationChange).ok());
  EXPECT_EQ(counts.get().size(), 2u);

  // Destruction stops a live observation too.
  auto second = QVAnnotationChangeObserver::start(center, queue, counts.callback());
  ASSERT_TRUE(second.ok());
  EXPECT_EQ(center->observerCountForTesting(QVNotifyAnnotationChange), 1u);
  second.value().reset();
  EXPECT_EQ(center->observerCountForTesting(QVNotifyAnnotationChange), 0u);
}

TEST(QVAnnotationChangeObserver, HearsPostsFromAnotherCenterThroughTheFiles) {
  platform::mbx::testing::TemporaryRoot root;
  const std::string directory = root.path() + "/run/quorvex/notify";
  auto watching = std::make_shared<platform::notify::LinuxNotificationCenter>(directory);
  platform::notify::LinuxNotificationCenter posting(directory);
  auto queue = platform::dispatch::SerialQueue::create("test.observer");
  Counts counts;
  auto observer = QVAnnotationChangeObserver::start(watching, queue, counts.callback());
  ASSERT_TRUE(observer.ok()) << observer.error().description();
  ASSERT_TRUE(posting.post(QVNotifyAnnotationChange).ok());
  EXPECT_TRUE(eventually([&] { return counts.get() == std::vector<std::uint64_t>{1}; }));
  queue->sync([&] { observer.value()->cancel(); });
}

}  // namespace
