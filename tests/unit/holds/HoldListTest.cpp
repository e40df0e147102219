// The server's hold list on its queue: holdOnPlugIn by plug-in identity,
// the keep-alive each hold owns, and the forced termination of plug-ins
// (completion only after every answer, on "killer-waiter"), including the
// one the database's uninstall observer starts.
#include <errno.h>

#include <atomic>
#include <thread>

#include "platform/dispatch/Queue.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/mbx/KeepAliveTransaction.h"
#include "qvd/QVDPlugInHold.h"
#include "tests/unit/holds/ServerHoldsFixture.h"

namespace qvd::testing {
namespace {

using platform::Uuid;

bool contains(const std::vector<std::string>& lines, const std::string& text) {
  for (const std::string& line : lines) {
    if (line.find(text) != std::string::npos) return true;
  }
  return false;
}

class HoldListTest : public ServerHoldsFixture {
 protected:
  std::shared_ptr<const QVDPlugInHold> hold(std::vector<std::shared_ptr<const QVDPlugIn>> plugIns,
                                            std::weak_ptr<QVDMbxClient> client = {}) {
    auto made = QVDPlugInHold::initWithPlugInsForClient(plugIns, std::move(client));
    server_.server()->addHold(made);
    return made;
  }
};

// (Release by token is shown through the "lock" request here and against
// the real daemon.)
TEST_F(HoldListTest, HoldOnPlugInGoesByIdentity) {
  const auto a = put("a");
  const auto b = put("b");
  auto first = plugIn(a);
  ASSERT_TRUE(first && plugIn(b));
  const std::uint64_t before = posts();
  hold({first});
  EXPECT_EQ(posts(), before + 1);
  EXPECT_TRUE(server_.server()->holdOnPlugIn(*first));
  EXPECT_FALSE(server_.server()->holdOnPlugIn(*plugIn(b)));

  // A new object for the same plug-in (the cache was emptied) is held too.
  server_.server()->setCacheLimit(0);
  ASSERT_NE(plugIn(put("c")), nullptr);
  auto rebuilt = plugIn(a);
  ASSERT_NE(rebuilt.get(), first.get());
  EXPECT_TRUE(server_.server()->holdOnPlugIn(*rebuilt));
}

TEST_F(HoldListTest, EachHoldKeepsTheDaemonAliveUntilItIsReleased) {
  const std::size_t baseline = platform::mbx::activeTransactionCount();
  const Uuid first = hold({})->uuid();
  hold({});
  EXPECT_EQ(platform::mbx::activeTransactionCount(), baseline + 2);
  server_.server()->unholdToken(first);
  EXPECT_EQ(platform::mbx::activeTransactionCount(), baseline + 1);
  server_.server()->stop();
  EXPECT_EQ(platform::mbx::activeTransactionCount(), baseline);

  // Holds are equal by token alone.
  const QVDPlugInHold one(first, {plugIn(put("x"))}, {});
  EXPECT_EQ(one, QVDPlugInHold(first, {}, {}));
  EXPECT_EQ(one.hash(), QVDPlugInHold(first, {}, {}).hash());
  EXPECT_FALSE(one == QVDPlugInHold(Uuid::generate(), {}, {}));
}

TEST_F(HoldListTest, TerminationCompletesOnceOnlyAfterEveryAnswer) {
  const auto versioned = put("versioned", "7.2");
  const auto plain = put("plain");
  const auto failing = put("failing");
  auto& lumend = *server_.fakes().serviceManager;
  lumend.setRemovalResult("com.example.versioned", 0);
  lumend.setRemovalResult("com.example.failing", EIO);
  lumend.holdReplies();
  platform::log::LogCaptureForTesting capture;
  std::atomic<int> completions{0};
  std::atomic<bool> onWaiter{false};
  server_.server()->terminatePlugInsReply({versioned, plain, failing}, [&] {
    onWaiter = platform::dispatch::currentQueueLabel() == "killer-waiter";
    ++completions;
  });
  ASSERT_EQ(lumend.removals().size(), 3u) << "every request is made before any answer";
  EXPECT_EQ(lumend.removals()[0].bundleIdentifier, "com.example.versioned");
  EXPECT_EQ(lumend.removals()[0].version, "7.2");
  EXPECT_EQ(lumend.removals()[1].version, "1") << "no BXBundleVersion";
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(completions, 0) << "no time-out: the completion waits for the answers";

  EXPECT_EQ(lumend.releaseReplies(), 3u);
  ASSERT_TRUE(eventually([&] { return completions == 1; }));
  EXPECT_TRUE(onWaiter);
  std::this_thread::sleep_for(20ms);
  EXPECT_EQ(completions, 1);

  const auto lines = capture.messages();
  EXPECT_TRUE(contains(lines, "requesting termination for com.example.versioned(1.0) lumend:7.2 " +
                                  versioned.uuid.toString()));
  EXPECT_TRUE(contains(
      lines, "one or more plug-ins have been terminated for uuid=" + versioned.uuid.toString()));
  EXPECT_TRUE(
      contains(lines, "lumend reported no plug-ins on record for uuid=" + plain.uuid.toString()));
  EXPECT_TRUE(contains(lines, "lumend error attempting to terminate plug-ins: error=" +
                                  std::to_string(EIO) + " for uuid=" + failing.uuid.toString()));
  EXPECT_TRUE(contains(lines, "waiting for 3 termination replies"));
  EXPECT_TRUE(contains(lines, "awaiting termination reply #2"));
}

TEST_F(HoldListTest, AnUninstalledPlugInIsTerminated) {
  const auto gone = put("gone");
  ASSERT_NE(plugIn(gone), nullptr);
  platform::log::LogCaptureForTesting capture;
  ASSERT_TRUE(server_.fakes().registry->unregisterPlugIn(gone.path).ok());
  ASSERT_TRUE(eventually([&] { return !server_.fakes().serviceManager->removals().empty(); }));
  EXPECT_EQ(server_.fakes().serviceManager->removals()[0].bundleIdentifier, "com.example.gone");
  ASSERT_TRUE(eventually([&] { return contains(capture.messages(), "removal complete for"); }));
  EXPECT_TRUE(contains(capture.messages(), "com.example.gone(" + gone.uuid.toString() + ")"));
}

}  // namespace
}  // namespace qvd::testing
