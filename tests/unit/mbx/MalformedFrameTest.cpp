// Peers that break the rules, over real sockets from a forked process: each
// broken frame ends only its own connection, with a logged reason, while
// another client keeps being served; a stalled half frame delays nobody; a
// peer that never reads is cut off at the output limit.
#include <gtest/gtest.h>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/mbx/FrameReader.h"
#include "platform/mbx/Reply.h"
#include "tests/unit/mbx/FrameFaultCases.h"
#include "tests/unit/mbx/MbxTestServer.h"

namespace platform::mbx {
namespace {

using namespace testing;

bool loggedContaining(const log::LogCaptureForTesting& capture, const std::string& text) {
  for (const auto& line : capture.lines()) {
    if (line.category == "mbx" && line.level >= log::Level::Error &&
        line.message.find(text) != std::string::npos)
      return true;
  }
  return false;
}

std::shared_ptr<Connection> client(const std::string& service) {
  auto connection = Connection::connectToService(service).value();
  connection->setEventHandler([](const ConnectionEvent&) {});
  connection->resume();
  return connection;
}

class MbxMalformed : public ::testing::Test {
 protected:
  TemporaryRoot root_;
};

TEST_F(MbxMalformed, EachBrokenRuleEndsOnlyItsConnection) {
  TestServer server("strict");
  ASSERT_TRUE(server.listening());
  // A client that stays connected throughout and must keep being answered.
  auto witness = client("strict");
  ASSERT_TRUE(witness->sendWithReplySync(Dictionary{}).ok());
  std::size_t index = 1;
  for (const FaultCase& c : frameFaultCases()) {
    SCOPED_TRACE(c.name);
    log::LogCaptureForTesting capture;
    RawPeer peer(root_.socketPath("strict"), c.bytes,
                 c.atEndOfStream ? RawAfter::ShutdownThenAwaitEof : RawAfter::AwaitEof);
    EXPECT_EQ(peer.wait(), RawPeer::kEndedByServer);
    ASSERT_TRUE(server.waitFor(index, "finalized"));
    EXPECT_TRUE(loggedContaining(capture, frameFaultName(c.fault)));
    // Valid frames ahead of the broken one were delivered; nothing after it.
    std::vector<std::string> expected;
    FrameReader reader;
    std::span<const std::uint8_t> input(c.bytes);
    for (auto step = reader.next(input); step.ok() && step.value(); step = reader.next(input))
      expected.push_back("seq " + step.value()->body.dictionary()->get("seq").description());
    expected.insert(expected.end(), {"invalid", "finalized"});
    EXPECT_EQ(server.events(index++), expected);
    EXPECT_TRUE(witness->sendWithReplySync(Dictionary{{"after", c.name}}).ok());
  }
}

TEST_F(MbxMalformed, AStalledHalfFrameDelaysNobody) {
  TestServer server("stall");
  const Bytes frame = frameBytes(FrameKind::Request, 1, Dictionary{{"k", Data(1000)}});
  RawPeer stalledInHeader(root_.socketPath("stall"), Bytes(frame.begin(), frame.begin() + 13),
                          RawAfter::HoldUntilReleased);
  RawPeer stalledInBody(root_.socketPath("stall"), Bytes(frame.begin(), frame.begin() + 500),
                        RawAfter::HoldUntilReleased);
  ASSERT_TRUE(eventually([&] { return server.connectionCount() == 2; }));
  auto connection = client("stall");
  const auto start = std::chrono::steady_clock::now();
  for (int i = 0; i < 200; ++i)
    ASSERT_TRUE(connection->sendWithReplySync(Dictionary{{"i", i}}).ok());
  EXPECT_LT(std::chrono::steady_clock::now() - start, 3s);
  // The stalled peers are still connected, with nothing delivered.
  EXPECT_TRUE(server.events(0).empty());
  EXPECT_TRUE(server.events(1).empty());
  stalledInHeader.release();
  stalledInBody.release();
  EXPECT_TRUE(server.waitFor(0, "invalid"));
  EXPECT_TRUE(server.waitFor(1, "invalid"));
}

TEST_F(MbxMalformed, APeerThatNeverReadsIsCutOffAtTheOutputLimit) {
  ConnectionLimits limits;
  limits.maxQueuedOutputBytes = 512u << 10;
  std::atomic<std::size_t> mostQueued{0};
  TestServer server("deaf", limits, [&](const std::shared_ptr<Connection>& c, const Message& m) {
    Reply reply = Reply::createReply(m);
    reply.body().set("blob", Data(64u << 10, 1));
    (void)reply.send();
    mostQueued = std::max(mostQueued.load(), c->queuedOutputBytesForTesting());
  });
  log::LogCaptureForTesting capture;
  Bytes requests;
  for (std::uint64_t id = 1; id <= 400; ++id)
    requests = concat({requests, frameBytes(FrameKind::Request, id, Dictionary{{"id", id}})});
  RawPeer deaf(root_.socketPath("deaf"), requests, RawAfter::HoldUntilReleased);
  ASSERT_TRUE(server.waitFor(0, "invalid"));
  EXPECT_TRUE(loggedContaining(capture, "does not read"));
  EXPECT_LE(mostQueued.load(), limits.maxQueuedOutputBytes);
  EXPECT_TRUE(roundTrip("deaf"));
  deaf.release();
}

}  // namespace
}  // namespace platform::mbx
