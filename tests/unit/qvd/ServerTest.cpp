// The server's own duties: the command line, stopping (holds released, one
// notification) and releasing a dead client's holds.
#include <gtest/gtest.h>

#include "Quorvex/QVDConstants.h"
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

}  // namespace
}  // namespace qvd::testing
