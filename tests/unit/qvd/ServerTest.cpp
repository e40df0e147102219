// The server's own duties: the command line, stopping (holds released, one
// notification), releasing a dead client's holds, and the process-wide
// instance.
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
  struct Case {
    std::vector<std::string> arguments;
    std::optional<QVDOptions> expected;  // none: a usage error
    int verboseSeen = 0;
  };
  auto options = [](std::string service, std::optional<std::string> db, std::uint64_t cache,
                    int verbose) {
    return std::optional<QVDOptions>(
        QVDOptions{std::move(service), std::move(db), cache, verbose, CommandLineStatus::Valid});
  };
  const std::string standard(QVDServiceName);
  const std::vector<Case> cases = {
      {{"qvd"}, options(standard, std::nullopt, 1000000, 0)},
      {{"qvd", "-S", "a", "-S", "b", "-d", "/x", "-c", "12"}, options("b", "/x", 12, 0)},
      {{"qvd", "-Sname", "-c7", "-v", "-v"}, options("name", std::nullopt, 7, 2)},
      {{"qvd", "-c", "abc"}, options(standard, std::nullopt, 0, 0)},
      {{"qvd", "-c", "12abc"}, options(standard, std::nullopt, 12, 0)},
      {{"qvd", "-c", "-5"}, options(standard, std::nullopt, 0, 0)},
      {{"qvd", "extra"}, std::nullopt},
      {{"qvd", "-v", "extra", "-v"}, std::nullopt, 1},
      {{"qvd", "-v", "-x", "-v"}, std::nullopt, 1},
      {{"qvd", "-x"}, std::nullopt},
      {{"qvd", "-S"}, std::nullopt},
      {{"qvd", "--", "extra"}, std::nullopt},
  };
  for (const Case& c : cases) {
    const QVDOptions parsed = parseOptions(c.arguments);
    ASSERT_EQ(parsed.status == CommandLineStatus::Valid, c.expected.has_value())
        << ::testing::PrintToString(c.arguments);
    if (!c.expected) {
      EXPECT_EQ(parsed.verboseCount, c.verboseSeen) << ::testing::PrintToString(c.arguments);
      continue;
    }
    EXPECT_EQ(parsed.serviceName, c.expected->serviceName);
    EXPECT_EQ(parsed.databasePath, c.expected->databasePath);
    EXPECT_EQ(parsed.cacheLimit, c.expected->cacheLimit);
    EXPECT_EQ(parsed.verboseCount, c.expected->verboseCount);
  }
}

class ServerTest : public ::testing::Test {
 protected:
  std::uint64_t notifications() {
    return server_.fakes().notifications->currentCount(QVNotifyAnnotationChange).value();
  }
  TestServer server_;
};

TEST_F(ServerTest, IsTheProcessWideInstanceAndHasItsQueues) {
  EXPECT_EQ(QVDServer::server(), server_.server());
  EXPECT_EQ(server_.server()->mbxQueue()->label(), "mbx");
  EXPECT_EQ(server_.server()->mainQueue()->label(), "service");
  EXPECT_EQ(server_.server()->mainQueue()->priority(), platform::dispatch::Priority::UserInitiated);
  EXPECT_EQ(server_.server()->holdQueue()->label(), "serverSync");
}

TEST_F(ServerTest, StopReleasesEveryHoldAndPostsOnce) {
  for (int holdCount : {0, 2}) {
    TestServer server;
    std::vector<Uuid> tokens;
    for (int i = 0; i < holdCount; ++i) {
      tokens.push_back(Uuid::generate());
      server.server()->addHold(std::make_shared<QVDPlugInHold>(
          tokens.back(), std::vector<std::shared_ptr<const QVDPlugIn>>{}, std::weak_ptr<QVDMbxClient>()));
    }
    EXPECT_EQ(server.server()->holds().size(), static_cast<std::size_t>(holdCount));
    platform::log::LoggerRegistry::shared().applyFilterForTesting("debug");
    platform::log::LogCaptureForTesting capture;
    server.server()->stop();
    platform::log::LoggerRegistry::shared().applyFilterForTesting("");
    EXPECT_TRUE(server.server()->holds().empty());
    EXPECT_EQ(server.fakes().notifications->currentCount(QVNotifyAnnotationChange).value(), 1u);
    std::vector<std::string> released;
    for (const auto& line : capture.messages()) {
      if (line.find("because server is stopping") != std::string::npos) released.push_back(line);
    }
    ASSERT_EQ(released.size(), tokens.size());
    for (std::size_t i = 0; i < tokens.size(); ++i) {
      EXPECT_EQ(released[i],
                "releasing plug-in hold " + tokens[i].toString() + " because server is stopping");
    }
    // The listener goes (its socket with it): nobody can connect any more.
    EXPECT_TRUE(eventually(
        [&] { return !platform::mbx::Connection::connectToService(server.serviceName()).ok(); }));
  }
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
  EXPECT_EQ(notifications(), 0u);
}

}  // namespace
}  // namespace qvd::testing
