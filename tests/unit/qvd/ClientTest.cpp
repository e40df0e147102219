// What a client object knows about its peer (this test process): path,
// entitlements, description, and its end.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>

#include "Quorvex/QVDConstants.h"
#include "platform/log/LogCaptureForTesting.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

class ClientTest : public ::testing::Test {
 protected:
  std::shared_ptr<QVDMbxClient> connect() {
    client_ = std::make_unique<TestClient>(server_);
    EXPECT_TRUE(client_->call(request("nope")).ok());
    return server_.clients().back();
  }
  const std::string self_ = std::filesystem::canonical("/proc/self/exe").string();
  TestServer server_;
  std::unique_ptr<TestClient> client_;
};

TEST_F(ClientTest, IdentifiesThePeer) {
  auto client = connect();
  EXPECT_EQ(client->pid(), ::getpid());
  EXPECT_EQ(client->path(), self_);
  // A program outside any bundle still gets a bundle object, for its path.
  ASSERT_TRUE(client->bundle());
  const std::string description = client->description();
  EXPECT_EQ(description.rfind("<QVDMbxClient 0x", 0), 0u) << description;
  EXPECT_NE(description.find(" pid=" + std::to_string(::getpid()) + " path=" + self_ + ">"),
            std::string::npos)
      << description;
  EXPECT_NE(description.find(" con="), std::string::npos);

  client_.reset();  // the peer hangs up
  ASSERT_TRUE(eventually([&] { return !client->acceptWork(); }));
  ASSERT_TRUE(eventually([&] { return !client->connection(); }));
  EXPECT_EQ(client->description(),
            "<QVDMbxClient " + description.substr(14, description.find(' ', 14) - 14) +
                " NO CONNECTION>");
}

TEST_F(ClientTest, EntitlementValues) {
  struct Case {
    Value value;
    bool entitled;
  };
  const std::vector<Case> cases = {
      {Value(), false}, {Value(0.0), false}, {Value(-2), true}, {Value(""), true},
      {Value(Array{}), true},
  };
  auto client = connect();
  for (const Case& c : cases) {
    Dictionary granted;
    if (!c.value.isNone()) granted.set(QVManagerEntitlement, c.value);
    server_.fakes().entitlements->setExecutableEntitlements(self_, granted);
    EXPECT_EQ(client->hasEntitlement(QVManagerEntitlement), c.entitled) << c.value.description();
    EXPECT_EQ(client->entitlementValueForKey(QVManagerEntitlement), c.value);
    EXPECT_FALSE(client->hasEntitlement(QVOverrideEntitlement));
  }
}

TEST_F(ClientTest, UnreadableEntitlementsGrantNothingAndAreLogged) {
  auto client = connect();
  server_.fakes().entitlements->setExecutableEntitlements(
      self_, Dictionary{{std::string(QVManagerEntitlement), true}});
  server_.fakes().entitlements->failExecutable(self_, platform::Error("codesign", 5, "EIO"));
  platform::log::LogCaptureForTesting capture;
  EXPECT_FALSE(client->hasEntitlement(QVManagerEntitlement));
  const auto lines = capture.messages();
  EXPECT_NE(std::find(lines.begin(), lines.end(),
                      "error retrieving entitlements for client " + std::to_string(::getpid())),
            lines.end());
}

}  // namespace
}  // namespace qvd::testing
