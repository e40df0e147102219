// Connections between two processes: the helper program (MbxTestPeer.cpp)
// on one side, the library in this process on the other. Ordering, replies
// both ways of waiting, both connection events, cancellation, contexts and
// the errors of requests whose connection ends first.
#include <gtest/gtest.h>

#include <thread>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/mbx/MbxError.h"
#include "platform/mbx/Reply.h"
#include "tests/unit/mbx/MbxTestServer.h"

namespace platform::mbx {
namespace {

using namespace testing;

class MbxConnection : public ::testing::Test {
 protected:
  // A client of `service` in this process that records its own events.
  std::shared_ptr<Connection> connect(const std::string& service, ConnectionLimits limits = {}) {
    auto connection = Connection::connectToService(service, limits);
    EXPECT_TRUE(connection.ok()) << connection.error().description();
    if (!connection.ok()) return nullptr;
    connection.value()->setEventHandler([recorder = clientEvents_](const ConnectionEvent& event) {
      const auto* error = std::get_if<ConnectionError>(&event);
      recorder->add(!error                               ? "message"
                    : *error == ConnectionError::Invalid ? "invalid"
                                                         : "goodbye");
    });
    connection.value()->resume();
    return connection.value();
  }
  bool invalidated() {
    return eventually([&] { return clientEvents_->count("invalid") == 1; });
  }
  static ErrorCode codeOf(const Result<Message>& r) {
    return r.ok() ? ErrorCode{} : *errorCodeOf(r.error());
  }

  TemporaryRoot root_;
  std::shared_ptr<Recorder> clientEvents_ = std::make_shared<Recorder>();
};

TEST_F(MbxConnection, ManyMessagesArriveInOrderThenGoodbyeThenInvalid) {
  TestServer server("order");
  PeerProcess client({"burst", "order", "3000"});
  EXPECT_EQ(client.wait(), 0);
  ASSERT_TRUE(server.waitFor(0, "finalized"));
  std::vector<std::string> expected;
  for (int i = 0; i < 3000; ++i) expected.push_back("seq " + std::to_string(i));
  expected.insert(expected.end(), {"request", "goodbye", "invalid", "finalized"});
  EXPECT_EQ(server.events(0), expected);
  // The identity was taken from the other process when it was accepted.
  ASSERT_NE(server.connection(0)->peer(), nullptr);
  EXPECT_EQ(server.connection(0)->peer()->pid(), client.pid());
}

TEST_F(MbxConnection, RepliesComeFromTheOtherProcessToTheirOwnCallers) {
  PeerProcess echo({"serve", "echo"});
  ASSERT_TRUE(eventually([] { return roundTrip("echo"); }));
  auto connection = connect("echo");
  ASSERT_NE(connection, nullptr);
  EXPECT_EQ(connection->peer(), nullptr);  // the client side takes no identity
  auto reply = connection->sendWithReplySync(Dictionary{{"op", "notify"}, {"count", 500}});
  ASSERT_TRUE(reply.ok()) << reply.error().description();
  EXPECT_EQ(reply.value().dictionary()->get("pid"), Value(static_cast<long long>(echo.pid())));
  // The messages came before the reply on the wire: all delivered by now.
  EXPECT_EQ(clientEvents_->count("message"), 500u);

  // Many asynchronous requests in flight, each answered on its own queue.
  auto replyQueue = dispatch::SerialQueue::create("test.replies");
  std::atomic<int> matched{0}, wrong{0};
  for (int i = 0; i < 300; ++i) {
    connection->sendWithReply(
        Dictionary{{"n", i}}, replyQueue, [&, i, replyQueue](Result<Message> r) {
          if (!replyQueue->isCurrent() || !r.ok() ||
              r.value().dictionary()->get("echo") != Value(Dictionary{{"n", i}}))
            ++wrong;
          ++matched;
        });
  }
  // Several threads waiting at once: one reads for all, the others are served
  // by the reactor; every reply reaches its own caller.
  auto pool = dispatch::ConcurrentQueue::shared(dispatch::Priority::Default);
  std::atomic<int> right{0}, finished{0};
  for (int t = 0; t < 4; ++t) {
    pool->async([&, t] {
      for (int i = 0; i < 100; ++i) {
        const Value body = Dictionary{{"t", t}, {"i", i}};
        auto r = connection->sendWithReplySync(body);
        right += r.ok() && r.value().dictionary()->get("echo") == body;
      }
      ++finished;
    });
  }
  ASSERT_TRUE(eventually([&] { return finished == 4 && matched == 300; }));
  EXPECT_EQ(right.load(), 400);
  EXPECT_EQ(wrong.load(), 0);
  EXPECT_EQ(connection->pendingReplyCountForTesting(), 0u);

  // A thread blocked on a reply that never comes is released by cancel().
  std::atomic<bool> released{false};
  pool->async([&] {
    released = codeOf(connection->sendWithReplySync(Dictionary{{"op", "ignore"}})) ==
               ErrorCode::ConnectionInvalid;
  });
  std::this_thread::sleep_for(50ms);
  connection->cancel();
  ASSERT_TRUE(eventually([&] { return released.load(); }));
  EXPECT_TRUE(invalidated());
}

TEST_F(MbxConnection, LargeRepliesDrainThroughTheOutputQueue) {
  // 8 MiB cannot go out in one write: the rest waits for the socket. The
  // blob travels already encoded, which the peer cannot tell.
  TestServer server("large", {}, [](const std::shared_ptr<Connection>&, const Message& m) {
    Reply reply = Reply::createReply(m);
    reply.setEncoded("blob", cbor::EncodedValue::encode(Value(Data(8u << 20, 0x5a))).value());
    reply.body().set("blob", "set later, ignored");
    reply.body().set("plain", 1);
    (void)reply.send();
  });
  auto connection = connect("large");
  ASSERT_NE(connection, nullptr);
  auto reply = connection->sendWithReplySync(Dictionary{});
  ASSERT_TRUE(reply.ok()) << reply.error().description();
  EXPECT_EQ(*reply.value().dictionary()->get("blob").data(), Data(8u << 20, 0x5a));
  EXPECT_EQ(reply.value().dictionary()->get("plain"), Value(1));
  EXPECT_EQ(server.connection(0)->queuedOutputBytesForTesting(), 0u);
}

TEST_F(MbxConnection, AnUnsendableReplyCanBeReplacedByAnother) {
  std::atomic<bool> firstRefused{false};
  TestServer server("oversize", {}, [&](const std::shared_ptr<Connection>&, const Message& m) {
    Reply reply = Reply::createReply(m);
    reply.setEncoded("blob", cbor::EncodedValue::encode(Value(Data(kMaxBodyBytes, 1))).value());
    const Status first = reply.send();
    firstRefused = !first.ok() && errorCodeOf(first.error()) == ErrorCode::BodyTooLarge;
    reply.replaceBody(Dictionary{{"error", "too large"}});
    (void)reply.send();
  });
  auto connection = connect("oversize");
  ASSERT_NE(connection, nullptr);
  auto reply = connection->sendWithReplySync(Dictionary{});
  ASSERT_TRUE(reply.ok()) << reply.error().description();
  EXPECT_TRUE(firstRefused.load());
  EXPECT_EQ(Value(*reply.value().dictionary()), Value(Dictionary{{"error", "too large"}}));
}

TEST_F(MbxConnection, RequestsFailWithTheConnectionsErrorWhenThePeerDies) {
  PeerProcess echo({"serve", "dying"});
  ASSERT_TRUE(eventually([] { return roundTrip("dying"); }));
  auto connection = connect("dying");
  ASSERT_NE(connection, nullptr);
  std::atomic<int> invalid{0};
  for (int i = 0; i < 5; ++i) {
    connection->sendWithReply(
        Dictionary{{"op", i == 2 ? "exit" : "wait"}}, nullptr,
        [&](Result<Message> r) { invalid += codeOf(r) == ErrorCode::ConnectionInvalid; });
  }
  // Two were answered before the peer exited; the three after it were not.
  ASSERT_TRUE(eventually([&] { return invalid.load() == 3; }));
  EXPECT_TRUE(invalidated());
  EXPECT_EQ(codeOf(connection->sendWithReplySync(Dictionary{})), ErrorCode::ConnectionInvalid);
  EXPECT_EQ(echo.wait(), 0);
}

TEST_F(MbxConnection, AfterSynchronousRequestsAGoodbyeStillArrives) {
  // Synchronous requests leave read watching off for the next one; it must
  // come back on by itself, or a goodbye and the close would never reach
  // the handler of a client that has stopped asking.
  PeerProcess echo({"serve", "parked"});
  ASSERT_TRUE(eventually([] { return roundTrip("parked"); }));
  auto connection = connect("parked");
  ASSERT_NE(connection, nullptr);
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(connection->sendWithReplySync(Dictionary{{"i", i}}).ok());
  std::atomic<bool> answered{false};
  connection->sendWithReply(Dictionary{}, nullptr, [&](Result<Message> r) { answered = r.ok(); });
  ASSERT_TRUE(eventually([&] { return answered.load(); }, 2s));
  ASSERT_TRUE(connection->sendWithReplySync(Dictionary{}).ok());
  connection->send(Dictionary{{"op", "goodbye"}});
  ASSERT_TRUE(eventually([&] { return clientEvents_->count("invalid") == 1; }, 2s));
  EXPECT_EQ(clientEvents_->entries(), (std::vector<std::string>{"goodbye", "invalid"}));
}

TEST_F(MbxConnection, CancelDeliversInvalidOnceAndEndsThePeersSide) {
  TestServer server("cancel");
  auto connection = connect("cancel");
  ASSERT_NE(connection, nullptr);
  ASSERT_TRUE(connection->sendWithReplySync(Dictionary{{"x", 1}}).ok());
  connection->cancel();
  connection->cancel();
  ASSERT_TRUE(invalidated());
  ASSERT_TRUE(server.waitFor(0, "invalid"));  // the server saw the end of the stream
  connection->send(Dictionary{{"seq", 1}});
  EXPECT_EQ(codeOf(connection->sendWithReplySync(Dictionary{})), ErrorCode::ConnectionInvalid);
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(clientEvents_->entries(), (std::vector<std::string>{"invalid"}));
  EXPECT_EQ(server.events(0), (std::vector<std::string>{"request", "invalid", "finalized"}));
}

TEST_F(MbxConnection, AReplyToAVanishedSenderIsDroppedHarmlessly) {
  log::LoggerRegistry::shared().applyFilterForTesting("mbx=debug");
  log::LogCaptureForTesting capture;
  std::mutex mu;
  std::optional<Message> held;
  const std::size_t baseline = activeTransactionCount();
  TestServer server("vanish", {}, [&](const std::shared_ptr<Connection>&, const Message& m) {
    if (m.dictionary()->get("op") != Value("slow")) return (void)Reply::createReply(m).send();
    std::lock_guard lock(mu);
    held = m;  // answered later, once the sender is gone
  });
  EXPECT_EQ(PeerProcess({"request-and-exit", "vanish"}).wait(), 0);
  ASSERT_TRUE(server.waitFor(0, "invalid"));
  {
    std::lock_guard lock(mu);
    ASSERT_TRUE(held.has_value());
    EXPECT_EQ(activeTransactionCount(), baseline + 1);  // the unanswered request
    Reply reply = Reply::createReply(*held);
    (void)reply.send();
    EXPECT_TRUE(reply.sent());
    held.reset();
    EXPECT_EQ(activeTransactionCount(), baseline);
  }
  bool logged = false;
  for (const auto& line : capture.lines())
    logged |= line.category == "mbx" && line.message.find("dropped") != std::string::npos;
  EXPECT_TRUE(logged);
  EXPECT_TRUE(roundTrip("vanish"));  // the process and the service go on
  log::LoggerRegistry::shared().applyFilterForTesting("");
}

TEST_F(MbxConnection, ContextIsFinalizedOnceAfterInvalid) {
  TestServer server("context");
  auto finalized = std::make_shared<Recorder>();
  auto connection = connect("context");
  ASSERT_NE(connection, nullptr);
  connection->setContext(std::make_shared<int>(7), [finalized, events = clientEvents_](auto c) {
    const bool right = events->count("invalid") == 1 && *static_cast<int*>(c.get()) == 7;
    finalized->add(right ? "after invalid" : "too early");
  });
  connection->cancel();
  ASSERT_TRUE(eventually([&] { return finalized->size() == 1; }));
  EXPECT_EQ(finalized->entries(), (std::vector<std::string>{"after invalid"}));
  EXPECT_EQ(connection->context(), nullptr);
  connection.reset();
  EXPECT_EQ(finalized->size(), 1u);
  // A connection never resumed finalizes its context when it goes away.
  auto unused = Connection::connectToService("context");
  ASSERT_TRUE(unused.ok());
  unused.value()->setContext(std::make_shared<int>(1),
                             [finalized](auto) { finalized->add("dropped"); });
  unused.value().reset();
  EXPECT_EQ(finalized->count("dropped"), 1u);
}

TEST_F(MbxConnection, MisuseAndBoundsAreErrorsNotHangs) {
  std::mutex mu;
  std::vector<Message> unanswered;
  std::atomic<int> deadlockRefused{0};
  TestServer server("bounds", {}, [&](const std::shared_ptr<Connection>& c, const Message& m) {
    // Waiting for a reply on the connection's own delivery queue would hang.
    deadlockRefused += codeOf(c->sendWithReplySync(Dictionary{})) == ErrorCode::WouldDeadlock;
    std::lock_guard lock(mu);
    unanswered.push_back(m);
  });
  auto suspended = Connection::connectToService("bounds");
  ASSERT_TRUE(suspended.ok());
  EXPECT_EQ(codeOf(suspended.value()->sendWithReplySync(Dictionary{})), ErrorCode::NotResumed);

  ConnectionLimits limits;
  limits.maxPendingReplies = 2;
  auto connection = connect("bounds", limits);
  ASSERT_NE(connection, nullptr);
  auto outcomes = std::make_shared<Recorder>();
  auto record = [outcomes](Result<Message> r) {
    outcomes->add(r.ok() ? "reply" : errorCodeName(*errorCodeOf(r.error())));
  };
  auto heldCount = [&] {
    std::lock_guard lock(mu);
    return unanswered.size();
  };
  for (int i = 0; i < 3; ++i) connection->sendWithReply(Dictionary{{"i", i}}, nullptr, record);
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 1 && heldCount() == 2; }));
  EXPECT_EQ(outcomes->entries(), (std::vector<std::string>{"too many pending replies"}));
  // Answering one makes room again; the connection never closed.
  {
    std::lock_guard lock(mu);
    (void)Reply::createReply(unanswered[0]).send();
  }
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 2; }));
  connection->sendWithReply(Dictionary{{"i", 4}}, nullptr, record);
  ASSERT_TRUE(eventually([&] { return heldCount() == 3; }));
  EXPECT_EQ(connection->pendingReplyCountForTesting(), 2u);
  EXPECT_EQ(deadlockRefused.load(), 3);
  EXPECT_EQ(clientEvents_->count("invalid"), 0u);
  // Unsendable bodies fail the one request, not the connection.
  connection->sendWithReply(Value(), nullptr, record);
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 3; }));
  EXPECT_EQ(outcomes->entries().back(), "unencodable body");
  std::lock_guard lock(mu);
  unanswered.clear();
}

}  // namespace
}  // namespace platform::mbx
