// The server's own duties: the command line, stopping (holds released, one
// notification) and releasing a dead client's holds, without a thread per
// client when many die together.
#include <gtest/gtest.h>

#include <algorithm>
#include <memory>

#include "Quorvex/QVDConstants.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/internal/ThreadPool.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "qvd/QVDOptions.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Uuid;

TEST(QVDOptionsTest, CommandLines) {
  const QVDOptions standard = parseOptions({"qvd"});
  EXPECT_EQ(standard.serviceName, QVDServiceName);
  EXPECT_EQ(standard.databasePath, std::nullopt);
  EXPECT_EQ(standard.cacheLimit, 1000000u);
  const QVDOptions set = parseOptions({"qvd", "-S", "a", "-Sb", "-d", "/x", "-c", "12abc", "-v", "-v"});
  ASSERT_EQ(set.status, CommandLineStatus::Valid);
  EXPECT_EQ(set.serviceName, "b") << "the last -S wins";
  EXPECT_EQ(set.databasePath, "/x");
  EXPECT_EQ(set.cacheLimit, 12u);
  EXPECT_EQ(set.verboseCount, 2);
  const QVDOptions bad = parseOptions({"qvd", "-v", "-x", "-v"});
  EXPECT_NE(bad.status, CommandLineStatus::Valid);
  EXPECT_EQ(bad.verboseCount, 1) << "parsing stops at the error";
  EXPECT_NE(parseOptions({"qvd", "-S"}).status, CommandLineStatus::Valid);
}

class ServerTest : public ::testing::Test {
 protected:
  std::uint64_t notifications() {
    return server_.fakes().notifications->currentCount(QVNotifyAnnotationChange).value();
  }
  TestServer server_;
};

TEST_F(ServerTest, StopReleasesEveryHoldAndPostsOnce) {
  std::vector<std::string> expected;
  for (int i = 0; i < 2; ++i) {
    const Uuid token = Uuid::generate();
    server_.server()->addHold(std::make_shared<QVDPlugInHold>(
        token, std::vector<std::shared_ptr<const QVDPlugIn>>{}, std::weak_ptr<QVDMbxClient>()));
    expected.push_back("releasing plug-in hold " + token.toString() + " because server is stopping");
  }
  EXPECT_EQ(notifications(), 2u) << "one per hold taken";
  platform::log::LoggerRegistry::shared().applyFilterForTesting("debug");
  platform::log::LogCaptureForTesting capture;
  server_.server()->stop();
  platform::log::LoggerRegistry::shared().applyFilterForTesting("");
  EXPECT_TRUE(server_.server()->holds().empty());
  EXPECT_EQ(notifications(), 3u) << "and one for all released at the stop";
  std::vector<std::string> released;
  for (const auto& line : capture.messages()) {
    if (line.find("because server is stopping") != std::string::npos) released.push_back(line);
  }
  EXPECT_EQ(released, expected);
  // The listener goes (its socket with it): nobody can connect any more.
  EXPECT_TRUE(eventually(
      [&] { return !platform::mbx::Connection::connectToService(server_.serviceName()).ok(); }));
}

TEST_F(ServerTest, ADeadClientsHoldsAreReleasedAndNoOtherHolds) {
  TestClient first(server_);
  ASSERT_TRUE(first.call(request("nope")).ok());
  TestClient second(server_);
  ASSERT_TRUE(second.call(request("nope")).ok());
  auto clients = server_.clients();
  ASSERT_EQ(clients.size(), 2u);
  auto hold = [&](const std::shared_ptr<QVDMbxClient>& client) {
    auto h = std::make_shared<QVDPlugInHold>(Uuid::generate(),
                                             std::vector<std::shared_ptr<const QVDPlugIn>>{}, client);
    server_.server()->addHold(h);
    return h;
  };
  hold(clients[0]);
  auto kept = hold(clients[1]);
  hold(clients[0]);
  first.cancel();
  ASSERT_TRUE(eventually([&] { return server_.server()->holds().size() == 1; }));
  EXPECT_EQ(server_.server()->holds().front(), kept);
  // One post per hold taken (3) and one per hold released (2).
  EXPECT_TRUE(eventually([&] { return notifications() == 5u; })) << notifications();
}

// Sets the process's pool limits for its lifetime.
class ScopedPoolLimits {
  using Pool = platform::dispatch::internal::ThreadPool;

 public:
  explicit ScopedPoolLimits(int cap) : saved_(Pool::instance().limits()) {
    platform::dispatch::internal::PoolLimits limits = saved_;
    limits.cap = cap;
    Pool::instance().setLimitsForTesting(limits);
  }
  ~ScopedPoolLimits() { Pool::instance().setLimitsForTesting(saved_); }

 private:
  const platform::dispatch::internal::PoolLimits saved_;
};

TEST_F(ServerTest, ClientsDyingTogetherWhileTheHoldQueueIsBusyHoldNoThreads) {
  // A pool this small would run out at once if each dying client held a
  // thread until the hold queue got to it.
  ScopedPoolLimits small(16);
  constexpr int kClients = 40;
  std::vector<std::unique_ptr<TestClient>> clients;
  for (int i = 0; i < kClients; ++i) {
    clients.push_back(std::make_unique<TestClient>(server_));
    ASSERT_TRUE(clients.back()->call(request("nope")).ok());
  }
  const auto served = server_.clients();
  ASSERT_EQ(served.size(), static_cast<std::size_t>(kClients));
  for (int i = 0; i < kClients; i += 10) {
    server_.server()->addHold(std::make_shared<QVDPlugInHold>(
        Uuid::generate(), std::vector<std::shared_ptr<const QVDPlugIn>>{}, served[i]));
  }

  platform::dispatch::Semaphore entered, release;
  server_.server()->holdQueue()->async([&] {
    entered.signal();
    release.wait();
  });
  entered.wait();
  for (auto& client : clients) client->cancel();
  // Every death is taken in while the hold queue is still busy...
  EXPECT_TRUE(eventually([&] {
    return std::none_of(served.begin(), served.end(),
                        [](const auto& c) { return c->acceptWork(); });
  }));
  release.signal();
  // ...and the holds go once it is free: a post for each taken and released.
  EXPECT_TRUE(eventually([&] { return server_.server()->holds().empty(); }));
  EXPECT_TRUE(eventually([&] { return notifications() == 8u; })) << notifications();
}

}  // namespace
}  // namespace qvd::testing
