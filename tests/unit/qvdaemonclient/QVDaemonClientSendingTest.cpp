// How requests travel: synchronous ones finish on the caller's thread before
// the call returns, asynchronous ones on "qvd_client" later; a daemon that
// is not running, goes away or comes back; values across a real connection.
#include <gtest/gtest.h>

#include <atomic>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/log/LogCaptureForTesting.h"
#include "tests/unit/mbx/MbxTestSupport.h"
#include "tests/unit/qvdaemonclient/FakeDaemon.h"

namespace {

using platform::Dictionary;
using platform::Result;
using platform::Value;
using platform::log::CaptureEcho;
using platform::log::LogCaptureForTesting;
using platform::mbx::testing::eventually;
using platform::mbx::testing::TemporaryRoot;

// What a reply handler saw, for checks on the test thread.
struct Seen {
  std::atomic<bool> ran{false};
  std::atomic<bool> onReplyQueue{false};
  std::thread::id thread;
  std::optional<Result<Value>> reply;
  platform::dispatch::Semaphore done;

  QVDReplyHandler handler(const std::shared_ptr<QVDaemonClient>& client) {
    return [this, queue = client->replyQueue()](const Result<Value>& got) {
      thread = std::this_thread::get_id();
      onReplyQueue = queue->isCurrent();
      reply.emplace(got);
      ran = true;
      done.signal();
    };
  }
};

class QVDaemonClientSending : public ::testing::Test {
 protected:
  std::shared_ptr<QVDaemonClient> client(const std::string& service) {
    return QVDaemonClient::initWithServiceName(service).value();
  }
  TemporaryRoot root_;
};

TEST_F(QVDaemonClientSending, AsynchronousMatchReturnsAtOnceAndRepliesOnTheReplyQueue) {
  qvdtest::FakeDaemon daemon("qvd.async");
  daemon.holdReplies();
  auto qvd = client("qvd.async");
  Seen seen;
  qvd->matchPlugIns(Dictionary{}, 0, seen.handler(qvd));
  // The daemon has not answered yet, so the call cannot have waited for it.
  ASSERT_TRUE(daemon.waitForRequests(1));
  EXPECT_FALSE(seen.ran);
  EXPECT_FALSE(daemon.request(1).contains("sync"));
  daemon.releaseReplies();
  seen.done.wait();
  EXPECT_TRUE(seen.onReplyQueue);
  EXPECT_EQ(qvd->replyQueue()->label(), "qvd_client");
  EXPECT_NE(seen.thread, std::this_thread::get_id());
}

TEST_F(QVDaemonClientSending, NoDaemonGivesEachRequestTheConnectionErrorAsCode4) {
  auto qvd = client("qvd.absent");
  for (QVDSending sending : {QVDSending::Asynchronous, QVDSending::Synchronous}) {
    Seen seen;
    qvd->readyPlugIns({}, sending, 0, std::nullopt, seen.handler(qvd));
    seen.done.wait();
    EXPECT_EQ(seen.onReplyQueue.load(), sending == QVDSending::Asynchronous);
    ASSERT_FALSE(seen.reply->ok());
    const std::string ipcText = seen.reply->error().description();
    EXPECT_NE(ipcText.find("nobody listens"), std::string::npos) << ipcText;
    std::optional<platform::Error> error = QVDaemonClient::errorInReply(*seen.reply);
    ASSERT_TRUE(error);
    EXPECT_TRUE(QVErrorIs(*error, QVErrorInvalidRequest));
    EXPECT_EQ(error->description(), ipcText);
  }
  // Once the daemon is there, the next request reaches it.
  qvdtest::FakeDaemon daemon("qvd.absent");
  Seen seen;
  qvd->bulkPlugins(0, seen.handler(qvd));
  seen.done.wait();
  EXPECT_TRUE(seen.reply->ok());
}

TEST_F(QVDaemonClientSending, ADaemonThatGoesAwayFailsWaitingRequestsIsLoggedAndIsReconnected) {
  qvdtest::FakeDaemon daemon("qvd.drop");
  auto qvd = client("qvd.drop");
  LogCaptureForTesting capture(CaptureEcho::Silent);
  daemon.holdReplies();
  Seen waiting;
  qvd->addPlugIns({"/a"}, waiting.handler(qvd));
  ASSERT_TRUE(daemon.waitForRequests(1));
  daemon.dropConnections();
  waiting.done.wait();
  ASSERT_FALSE(waiting.reply->ok());
  EXPECT_EQ(QVDaemonClient::errorInReply(*waiting.reply)->code(), QVErrorInvalidRequest);
  EXPECT_TRUE(eventually([&] {
    for (const auto& line : capture.lines()) {
      if (line.message == "Communications error: connection invalid" &&
          line.level == platform::log::Level::Error && line.category == "ops") {
        return true;
      }
    }
    return false;
  }));
  daemon.releaseReplies();
  Seen again;
  qvd->removePlugIns({"/a"}, again.handler(qvd));
  again.done.wait();
  EXPECT_TRUE(again.reply->ok()) << again.reply->error().description();
}

TEST_F(QVDaemonClientSending, SynchronousMatchCarriesNestedValuesBothWays) {
  qvdtest::FakeDaemon daemon("qvd.values");
  daemon.answerWith([](const Dictionary& request) {
    return Dictionary{{"matches", request.get("rules").dictionary()->get("payload")}};
  });
  auto qvd = client("qvd.values");
  const Value payload(Dictionary{
      {"date", platform::Date{1795411478.25}},
      {"uuid", *platform::Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F")},
      {"data", platform::Data{0x00, 0xff, 0x10}},
      {"list", platform::Array{-5, 18446744073709551615ull, 2.5, true, "text"}},
      {"nested", Dictionary{{"empty", Dictionary{}}, {"none of it", platform::Array{}}}},
  });
  const std::optional<platform::cbor::EncodedValue> wire = QVDaemonClient::convertToMBX(payload, 3);
  ASSERT_TRUE(wire);
  EXPECT_EQ(wire->decode(), payload);
  EXPECT_FALSE(QVDaemonClient::convertToMBX(payload, 2));
  EXPECT_FALSE(QVDaemonClient::convertToMBX(Value(platform::Array{"ok", Value()}), 3));
  // A synchronous match finishes on the calling thread before returning.
  Seen seen;
  qvd->matchPlugIns(Dictionary{{"payload", payload}}, QVDiscoverSynchronous, seen.handler(qvd));
  ASSERT_TRUE(seen.ran);
  EXPECT_EQ(seen.thread, std::this_thread::get_id());
  EXPECT_FALSE(seen.onReplyQueue);
  EXPECT_EQ(daemon.request(1).get("sync"), Value(true));
  EXPECT_EQ(daemon.request(1).get("flags"), Value(QVDiscoverSynchronous));
  ASSERT_TRUE(seen.reply->ok());
  EXPECT_FALSE(QVDaemonClient::errorInReply(*seen.reply));
  const Value back = qvd->convertFromMBX(seen.reply->value().dictionary()->get("matches"));
  EXPECT_EQ(back, payload) << back.description();
  EXPECT_TRUE(back.dictionary()->get("date").date());
  EXPECT_TRUE(back.dictionary()->get("uuid").uuid());
  EXPECT_TRUE(back.dictionary()->get("data").data());
}

}  // namespace
