// Connections between two processes: the helper program (MbxTestPeer.cpp)
// on one side, the library in this process on the other. Ordering, replies
// both ways of waiting, both connection events, cancellation, contexts and
// the errors of requests whose connection ends first.
#include <gtest/gtest.h>
#include <unistd.h>

#include <atomic>

#include "platform/dispatch/ConcurrentQueue.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/KeepAliveTransaction.h"
#include "platform/mbx/MbxError.h"
#include "platform/mbx/Reply.h"
#include "tests/unit/mbx/MbxTestServer.h"
#include "tests/unit/mbx/MbxTestSupport.h"

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
      if (const auto* error = std::get_if<ConnectionError>(&event)) {
        recorder->add(*error == ConnectionError::Invalid ? "invalid" : "goodbye");
      } else {
        recorder->add("message");
      }
    });
    connection.value()->resume();
    return connection.value();
  }

  TemporaryRoot root_;
  std::shared_ptr<Recorder> clientEvents_ = std::make_shared<Recorder>();
};

TEST_F(MbxConnection, ManyMessagesArriveInOrderThenGoodbyeThenInvalid) {
  TestServer server("order");
  ASSERT_TRUE(server.listening());
  constexpr int kCount = 3000;
  PeerProcess client({"burst", "order", std::to_string(kCount), "goodbye"});
  EXPECT_EQ(client.wait(), 0);
  ASSERT_TRUE(server.waitFor(0, "finalized"));

  std::vector<std::string> expected;
  for (int i = 0; i < kCount; ++i) expected.push_back("seq " + std::to_string(i));
  expected.insert(expected.end(), {"request", "goodbye", "invalid", "finalized"});
  EXPECT_EQ(server.events(0), expected);

  // The identity was taken from the other process when it was accepted.
  const PeerIdentity* peer = server.connection(0)->peer();
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->pid(), client.pid());
  EXPECT_NE(server.connection(0)->description().find(std::to_string(client.pid())),
            std::string::npos);
}

TEST_F(MbxConnection, SyncAndAsyncRepliesComeFromTheOtherProcess) {
  PeerProcess echo({"serve", "echo"});
  ASSERT_TRUE(echo.waitForLine("ready"));
  auto connection = connect("echo");
  ASSERT_NE(connection, nullptr);
  EXPECT_EQ(connection->peer(), nullptr);  // the client side takes no identity

  auto reply = connection->sendWithReplySync(Dictionary{{"n", -1}});
  ASSERT_TRUE(reply.ok()) << reply.error().description();
  EXPECT_TRUE(reply.value().isReply());
  EXPECT_EQ(reply.value().dictionary()->get("echo"), Value(Dictionary{{"n", -1}}));
  EXPECT_EQ(reply.value().dictionary()->get("pid"), Value(static_cast<long long>(echo.pid())));

  // Many requests in flight at once: each handler gets its own reply, on the
  // queue it asked for.
  constexpr int kRequests = 300;
  auto replyQueue = dispatch::SerialQueue::create("test.replies");
  std::atomic<int> matched{0};
  std::atomic<int> wrong{0};
  for (int i = 0; i < kRequests; ++i) {
    connection->sendWithReply(Dictionary{{"n", i}}, replyQueue,
                              [&, i, replyQueue](Result<Message> answer) {
                                if (!replyQueue->isCurrent() || !answer.ok() ||
                                    answer.value().dictionary()->get("echo") !=
                                        Value(Dictionary{{"n", i}})) {
                                  ++wrong;
                                }
                                ++matched;
                              });
  }
  ASSERT_TRUE(eventually([&] { return matched.load() == kRequests; }));
  EXPECT_EQ(wrong.load(), 0);
  EXPECT_EQ(connection->pendingReplyCountForTesting(), 0u);
  connection->cancel();
  ASSERT_TRUE(eventually([&] { return clientEvents_->count("invalid") == 1; }));
}

TEST_F(MbxConnection, ASyncWaiterDeliversEventsInOrderWhileItReads) {
  PeerProcess echo({"serve", "notify"});
  ASSERT_TRUE(echo.waitForLine("ready"));
  auto seen = std::make_shared<Recorder>();
  auto connection = Connection::connectToService("notify").value();
  connection->setEventHandler([seen, queue = connection->deliveryQueue()](const ConnectionEvent& e) {
    if (!queue->isCurrent()) seen->add("off-queue");
    if (const auto* message = std::get_if<Message>(&e)) {
      seen->add(message->dictionary()->get("seq").description());
    }
  });
  connection->resume();
  // The messages come before the reply on the wire, so they have all been
  // delivered, in order, by the time the reply is handed back.
  auto reply = connection->sendWithReplySync(Dictionary{{"op", "notify"}, {"count", 500}});
  ASSERT_TRUE(reply.ok());
  std::vector<std::string> expected;
  for (int i = 0; i < 500; ++i) expected.push_back(std::to_string(i));
  EXPECT_EQ(seen->entries(), expected);

  // Several threads waiting at once: one reads for all, the others are served
  // by the reactor; every reply reaches its own caller.
  auto pool = dispatch::ConcurrentQueue::shared(dispatch::Priority::Default);
  std::atomic<int> right{0};
  std::atomic<int> finished{0};
  for (int t = 0; t < 4; ++t) {
    pool->async([&, t] {
      for (int i = 0; i < 100; ++i) {
        const Value body = Dictionary{{"t", t}, {"i", i}};
        auto r = connection->sendWithReplySync(body);
        if (r.ok() && r.value().dictionary()->get("echo") == body) ++right;
      }
      ++finished;
    });
  }
  ASSERT_TRUE(eventually([&] { return finished.load() == 4; }));
  EXPECT_EQ(right.load(), 400);

  // A thread blocked waiting for a reply that never comes is released by cancel().
  std::atomic<int> released{0};
  pool->async([&] {
    auto r = connection->sendWithReplySync(Dictionary{{"op", "ignore"}});
    if (!r.ok() && errorCodeOf(r.error()) == ErrorCode::ConnectionInvalid) ++released;
  });
  std::this_thread::sleep_for(50ms);
  connection->cancel();
  ASSERT_TRUE(eventually([&] { return released.load() == 1; }));
}

TEST_F(MbxConnection, LargeRepliesDrainThroughTheOutputQueue) {
  // 8 MiB cannot go out in one write: the rest waits for the socket.
  TestServer server("large", {}, [](const std::shared_ptr<Connection>&, const Message& m) {
    Reply reply = Reply::createReply(m);
    reply.body().set("blob", Data(8u << 20, 0x5a));
    reply.send();
  });
  auto connection = connect("large");
  ASSERT_NE(connection, nullptr);
  for (int i = 0; i < 3; ++i) {
    auto reply = connection->sendWithReplySync(Dictionary{{"i", i}});
    ASSERT_TRUE(reply.ok()) << reply.error().description();
    EXPECT_EQ(*reply.value().dictionary()->get("blob").data(), Data(8u << 20, 0x5a));
  }
  EXPECT_EQ(server.connection(0)->queuedOutputBytesForTesting(), 0u);
}

TEST_F(MbxConnection, RequestsFailWithTheConnectionsErrorWhenThePeerDies) {
  PeerProcess echo({"serve", "dying"});
  ASSERT_TRUE(echo.waitForLine("ready"));
  auto connection = connect("dying");
  ASSERT_NE(connection, nullptr);
  auto queue = dispatch::SerialQueue::create("test.replies");
  std::atomic<int> invalid{0};
  for (int i = 0; i < 5; ++i) {
    connection->sendWithReply(Dictionary{{"op", i == 2 ? "exit" : "wait"}}, queue,
                              [&](Result<Message> answer) {
                                if (!answer.ok() && errorCodeOf(answer.error()) ==
                                                        ErrorCode::ConnectionInvalid) {
                                  ++invalid;
                                }
                              });
  }
  // Two were answered before the peer exited; the three after it were not.
  ASSERT_TRUE(eventually([&] { return invalid.load() == 3; }));
  ASSERT_TRUE(eventually([&] { return clientEvents_->count("invalid") == 1; }));
  auto late = connection->sendWithReplySync(Dictionary{{"n", 1}});
  ASSERT_FALSE(late.ok());
  EXPECT_EQ(errorCodeOf(late.error()), ErrorCode::ConnectionInvalid);
  EXPECT_EQ(echo.wait(), 0);
}

TEST_F(MbxConnection, GoodbyeFromTheServerIsTerminationImminent) {
  PeerProcess echo({"serve", "bye"});
  ASSERT_TRUE(echo.waitForLine("ready"));
  auto connection = connect("bye");
  ASSERT_NE(connection, nullptr);
  connection->send(Dictionary{{"op", "goodbye"}});
  ASSERT_TRUE(eventually([&] { return clientEvents_->count("invalid") == 1; }));
  EXPECT_EQ(clientEvents_->entries(), (std::vector<std::string>{"goodbye", "invalid"}));
}

TEST_F(MbxConnection, AfterSynchronousRequestsUnsolicitedInputStillArrives) {
  // Synchronous requests leave read watching off for the next one; it must
  // come back on by itself, or a goodbye and the close would never reach
  // the handler of a client that has stopped asking.
  PeerProcess echo({"serve", "parked"});
  ASSERT_TRUE(echo.waitForLine("ready"));
  auto connection = connect("parked");
  ASSERT_NE(connection, nullptr);
  for (int i = 0; i < 3; ++i) ASSERT_TRUE(connection->sendWithReplySync(Dictionary{{"i", i}}).ok());
  // An asynchronous request right after is answered through the pool.
  std::atomic<bool> answered{false};
  connection->sendWithReply(Dictionary{{"i", 3}}, nullptr,
                            [&](Result<Message> reply) { answered = reply.ok(); });
  ASSERT_TRUE(eventually([&] { return answered.load(); }, 2s));
  ASSERT_TRUE(connection->sendWithReplySync(Dictionary{{"i", 4}}).ok());
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
  ASSERT_TRUE(eventually([&] { return clientEvents_->count("invalid") == 1; }));
  // The server saw the end of the stream.
  ASSERT_TRUE(server.waitFor(0, "invalid"));
  connection->send(Dictionary{{"seq", 1}});
  auto after = connection->sendWithReplySync(Dictionary{{"x", 2}});
  EXPECT_EQ(errorCodeOf(after.error()), ErrorCode::ConnectionInvalid);
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
    if (m.dictionary()->get("op") != Value("slow")) {
      Reply::createReply(m).send();
      return;
    }
    std::lock_guard<std::mutex> lock(mu);
    held = m;  // answered later, once the sender is gone
  });
  {
    PeerProcess client({"request-and-exit", "vanish"});
    EXPECT_EQ(client.wait(), 0);
  }
  ASSERT_TRUE(server.waitFor(0, "invalid"));
  {
    std::lock_guard<std::mutex> lock(mu);
    ASSERT_TRUE(held.has_value());
    EXPECT_EQ(activeTransactionCount(), baseline + 1);  // the unanswered request

    Reply reply = Reply::createReply(*held);
    reply.body().set("late", true);
    reply.send();
    EXPECT_TRUE(reply.sent());
    held.reset();
    EXPECT_EQ(activeTransactionCount(), baseline);
  }

  bool logged = false;
  for (const auto& line : capture.lines()) {
    if (line.category == "mbx" && line.message.find("dropped") != std::string::npos) logged = true;
  }
  EXPECT_TRUE(logged);
  EXPECT_TRUE(roundTrip("vanish"));  // the process and the service go on
  log::LoggerRegistry::shared().applyFilterForTesting("");
}

TEST_F(MbxConnection, NonMapBodiesAreDeliveredAndTheConnectionStays) {
  TestServer server("nonmap");
  RawPeer peer(root_.socketPath("nonmap"),
               concat({frameBytes(FrameKind::Message, 1, Value(5)),
                       frameBytes(FrameKind::Message, 2, Value("text")),
                       frameBytes(FrameKind::Message, 7, Dictionary{{"seq", 1}})}),
               RawAfter::ShutdownThenAwaitEof);
  EXPECT_EQ(peer.wait(), RawPeer::kEndedByServer);
  ASSERT_TRUE(server.waitFor(0, "finalized"));
  EXPECT_EQ(server.events(0), (std::vector<std::string>{"non-map 5", "non-map text", "seq 1",
                                                        "invalid", "finalized"}));
}

TEST_F(MbxConnection, ContextIsFinalizedOnceAfterInvalid) {
  auto finalized = std::make_shared<Recorder>();
  {
    auto connection = Connection::connectToService("none");
    EXPECT_EQ(errorCodeOf(connection.error()), ErrorCode::ServiceUnavailable);
  }
  TestServer server("context");
  auto connection = connect("context");
  ASSERT_NE(connection, nullptr);
  auto clientEvents = clientEvents_;
  connection->setContext(std::make_shared<int>(7), [finalized, clientEvents](std::shared_ptr<void> c) {
    finalized->add(clientEvents->count("invalid") == 1 && *static_cast<int*>(c.get()) == 7
                       ? "after invalid"
                       : "too early");
  });
  EXPECT_EQ(*static_cast<int*>(connection->context().get()), 7);
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
                             [finalized](std::shared_ptr<void>) { finalized->add("dropped"); });
  unused.value().reset();
  EXPECT_EQ(finalized->count("dropped"), 1u);
}

TEST_F(MbxConnection, MisuseAndBoundsAreErrorsNotHangs) {
  std::mutex mu;
  std::vector<Message> unanswered;
  std::atomic<int> deadlockRefused{0};
  TestServer server("bounds", {}, [&](const std::shared_ptr<Connection>& c, const Message& m) {
    // Waiting for a reply on the connection's own delivery queue would hang.
    auto inner = c->sendWithReplySync(Dictionary{});
    if (!inner.ok() && errorCodeOf(inner.error()) == ErrorCode::WouldDeadlock) ++deadlockRefused;
    std::lock_guard<std::mutex> lock(mu);
    unanswered.push_back(m);
  });

  auto suspended = Connection::connectToService("bounds");
  ASSERT_TRUE(suspended.ok());
  EXPECT_EQ(errorCodeOf(suspended.value()->sendWithReplySync(Dictionary{}).error()),
            ErrorCode::NotResumed);

  ConnectionLimits limits;
  limits.maxPendingReplies = 2;
  auto connection = connect("bounds", limits);
  ASSERT_NE(connection, nullptr);
  auto queue = dispatch::SerialQueue::create("test.replies");
  auto outcomes = std::make_shared<Recorder>();
  auto record = [outcomes](Result<Message> r) {
    outcomes->add(r.ok() ? "reply" : errorCodeName(*errorCodeOf(r.error())));
  };
  connection->sendWithReply(Dictionary{{"i", 1}}, queue, record);
  connection->sendWithReply(Dictionary{{"i", 2}}, queue, record);
  connection->sendWithReply(Dictionary{{"i", 3}}, queue, record);
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 1; }));
  EXPECT_EQ(outcomes->entries(), (std::vector<std::string>{"too many pending replies"}));
  EXPECT_EQ(connection->pendingReplyCountForTesting(), 2u);

  // Answering one makes room again; the connection never closed.
  ASSERT_TRUE(eventually([&] {
    std::lock_guard<std::mutex> lock(mu);
    return unanswered.size() == 2;
  }));
  {
    std::lock_guard<std::mutex> lock(mu);
    Reply::createReply(unanswered[0]).send();
  }
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 2; }));
  connection->sendWithReply(Dictionary{{"i", 4}}, queue, record);
  ASSERT_TRUE(eventually([&] {
    std::lock_guard<std::mutex> lock(mu);
    return unanswered.size() == 3;
  }));
  EXPECT_EQ(connection->pendingReplyCountForTesting(), 2u);
  EXPECT_EQ(deadlockRefused.load(), 3);
  EXPECT_EQ(clientEvents_->count("invalid"), 0u);
  // Unsendable bodies fail the one request, not the connection.
  connection->sendWithReply(Value(), queue, record);
  ASSERT_TRUE(eventually([&] { return outcomes->size() == 3; }));
  EXPECT_EQ(outcomes->entries().back(), "unencodable body");
  {
    std::lock_guard<std::mutex> lock(mu);
    unanswered.clear();
  }
}

TEST(MbxKeepAlive, CountsLiveTransactionsAcrossMovesAndThreads) {
  const std::size_t base = activeTransactionCount();
  {
    KeepAliveTransaction a;
    KeepAliveTransaction b;
    EXPECT_EQ(activeTransactionCount(), base + 2);
    KeepAliveTransaction c(std::move(a));
    EXPECT_FALSE(a.active());
    EXPECT_EQ(activeTransactionCount(), base + 2);
    b = std::move(c);  // b's own transaction ends; c's moves in
    EXPECT_EQ(activeTransactionCount(), base + 1);
    b.end();
    b.end();
    EXPECT_EQ(activeTransactionCount(), base);
  }
  EXPECT_EQ(activeTransactionCount(), base);

  auto queue = dispatch::ConcurrentQueue::shared(dispatch::Priority::Default);
  std::atomic<int> done{0};
  for (int i = 0; i < 64; ++i) {
    queue->async([&] {
      for (int j = 0; j < 1000; ++j) KeepAliveTransaction t;
      ++done;
    });
  }
  ASSERT_TRUE(eventually([&] { return done.load() == 64; }));
  EXPECT_EQ(activeTransactionCount(), base);
}

}  // namespace
}  // namespace platform::mbx
