// Request envelopes and dispatch over real connections: version and name
// checks, requests of a dead client, synchronous submission, finishing once.
// (Each request name reaching its handler, and bodies that are no map, are
// shown against the real daemon.)
#include <gtest/gtest.h>

#include <future>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "platform/log/LogCaptureForTesting.h"
#include "qvd/Transaction.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Dictionary;
using platform::Value;

class DispatchTest : public ::testing::Test {
 protected:
  void TearDown() override { Transaction::removeRequestsForTesting(); }
  TestServer server_;
};

TEST_F(DispatchTest, EnvelopeErrors) {
  auto with = [](Value name, Value version) {
    Dictionary d = request("");
    d.set(QVDRequestKey, std::move(name));
    d.set(QVDVersionKey, std::move(version));
    return d;
  };
  const std::vector<std::pair<Dictionary, ErrorReply>> cases = {
      {with("match", 1), {7, "unsupported protocol version 1 (current 3)"}},
      {with("match", 4), {7, "unsupported protocol version 4 (current 3)"}},
      {with("match", "3"), {7, "unsupported protocol version 0 (current 3)"}},
      {with(42, 3), {4, "invalid request format (missing type)"}},
      {with("Match", 3), {4, "unrecognized request"}},  // names are case-sensitive
      {with("nope", 2), {4, "unrecognized request"}},   // version 2 is accepted
  };
  TestClient client(server_);
  for (const auto& [message, expected] : cases) {
    auto reply = client.call(message);
    ASSERT_TRUE(reply.ok());
    EXPECT_EQ(errorOf(*reply), expected) << Value(message).description();
    EXPECT_EQ(reply->dictionary()->size(), 2u) << "only the error keys";
  }
}

// Holds the service queue inside a "block" handler until released.
struct ServiceQueueBlocker {
  std::promise<void> entered, released;
  ServiceQueueBlocker() {
    Transaction::addRequestForTesting("block", [this](Transaction& t) {
      entered.set_value();
      released.get_future().wait();
      t.done();
    });
  }
};

TEST_F(DispatchTest, QueuedRequestOfADeadClientIsDroppedUnlessItWasSynchronous) {
  for (bool synchronous : {false, true}) {
    SCOPED_TRACE(synchronous ? "sync" : "async");
    ServiceQueueBlocker blocker;
    std::atomic<int> handled{0};
    Transaction::addRequestForTesting("count", [&](Transaction& t) {
      ++handled;
      t.done();
    });
    TestClient holder(server_);
    holder.callAsync(request("block"));
    blocker.entered.get_future().wait();

    const std::size_t before = server_.clients().size();
    TestClient dying(server_);
    Dictionary counted = request("count");
    if (synchronous) counted.set(QVDSynchronousRequestKey, true);
    dying.callAsync(counted);
    ASSERT_TRUE(eventually([&] { return server_.clients().size() == before + 1; }));
    std::shared_ptr<QVDMbxClient> client = server_.clients().back();
    dying.cancel();
    if (!synchronous) {
      // The death clears the client's flag while its request still waits.
      ASSERT_TRUE(eventually([&] { return !client->acceptWork(); }));
    } else {
      // The death waits behind the synchronous request.
      std::this_thread::sleep_for(50ms);
      EXPECT_TRUE(client->acceptWork());
    }
    blocker.released.set_value();
    ASSERT_TRUE(eventually([&] { return holder.asyncReplyCount() == 1; }));
    // Anything queued after the blocker has run once this answers.
    TestClient probe(server_);
    ASSERT_TRUE(probe.call(request("nope")).ok());
    EXPECT_EQ(handled.load(), synchronous ? 1 : 0);
    ASSERT_TRUE(eventually([&] { return !client->acceptWork(); }));
    Transaction::removeRequestsForTesting();
  }
}

TEST_F(DispatchTest, ADeadClientGetsOnlyVersionErrors) {
  // The version check comes before the client's state. Mark the client dead
  // while its connection still carries requests.
  int handled = 0;
  Transaction::addRequestForTesting("count", [&](Transaction& t) {
    ++handled;
    t.done();
  });
  TestClient client(server_);
  ASSERT_TRUE(client.call(request("nope")).ok());
  server_.clients().back()->dead();
  client.callAsync(request("count"));
  Dictionary old = request("count");
  old.set(QVDVersionKey, 1);
  auto reply = client.call(old);
  ASSERT_TRUE(reply.ok());
  EXPECT_EQ(errorOf(*reply).code, 7u);
  // Dispatched in order: the earlier request was dropped without a reply.
  EXPECT_EQ(client.asyncReplyCount(), 0u);
  EXPECT_EQ(handled, 0);
}

TEST_F(DispatchTest, FinishingTwiceSendsOneReplyAndADeferredReplyToAGoneClientIsDropped) {
  std::shared_ptr<Transaction> kept;
  std::promise<void> deferred;
  Transaction::addRequestForTesting("twice", [](Transaction& t) {
    t.reply().set("first", true);
    t.done();
    t.failMessage(4, "too late");
    t.done();
  });
  Transaction::addRequestForTesting("defer", [&](Transaction& t) {
    kept = t.shared_from_this();
    deferred.set_value();
  });
  platform::log::LogCaptureForTesting capture;
  {
    TestClient client(server_);
    auto reply = client.call(request("twice"));
    ASSERT_TRUE(reply.ok());
    EXPECT_EQ(reply->dictionary()->get("first"), Value(true));
    EXPECT_EQ(errorOf(*reply).code, 0u);
    // The next reply on the connection answers the next request, so a
    // stray second reply would have been taken as this one's.
    auto next = client.call(request("nope"));
    ASSERT_TRUE(next.ok());
    EXPECT_EQ(errorOf(*next), (ErrorReply{4, "unrecognized request"}));

    client.callAsync(request("defer"));
    deferred.get_future().wait();
  }
  // The client has gone; finishing now must do no harm.
  ASSERT_TRUE(kept);
  ASSERT_TRUE(eventually([&] { return !kept->client()->acceptWork(); }));
  kept->failMessage(4, "answered late");
  EXPECT_TRUE(kept->finished());
  int refused = 0;
  for (const auto& line : capture.messages()) {
    refused += line.find("was refused") != std::string::npos ||
               line.find("failed after its reply") != std::string::npos;
  }
  EXPECT_EQ(refused, 2);
}

TEST_F(DispatchTest, FailErrorUsesTheOwnDomainsCodeAndTheGivenCodeOtherwise) {
  struct Case {
    platform::Error error;
    ErrorReply expected;
  };
  const std::vector<Case> cases = {
      {QVErrorWithCodeMessage(QVErrorBadPath, "no such file"), {9, "no such file"}},
      {QVErrorWithCodeMessage(QVErrorDenied, std::nullopt), {11, "QVErrorDenied"}},
      {platform::Error("POSIX", 2, "No such file or directory"), {2, "No such file or directory"}},
  };
  std::size_t next = 0;
  Transaction::addRequestForTesting("fail",
                                    [&](Transaction& t) { t.failError(2, cases[next].error); });
  TestClient client(server_);
  for (; next < cases.size(); ++next) {
    auto reply = client.call(request("fail"));
    ASSERT_TRUE(reply.ok());
    EXPECT_EQ(errorOf(*reply), cases[next].expected) << cases[next].error.description();
  }
}

}  // namespace
}  // namespace qvd::testing
