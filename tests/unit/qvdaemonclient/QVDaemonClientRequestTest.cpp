// What each request puts on the wire, checked at a fake daemon: exactly the
// request's keys, with the wire types the daemon reads.
#include <gtest/gtest.h>

#include <functional>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "Quorvex/QVErrors.h"
#include "platform/dispatch/Semaphore.h"
#include "tests/unit/mbx/MbxTestSupport.h"
#include "tests/unit/qvdaemonclient/FakeDaemon.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Result;
using platform::Uuid;
using platform::Value;

const Uuid kA = *Uuid::parse("6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F");
const Uuid kB = *Uuid::parse("00000000-0000-4000-8000-000000000001");
const Uuid kC = *Uuid::parse("FFFFFFFF-FFFF-4FFF-BFFF-FFFFFFFFFFFF");

// Deliberately not in path order: the arrays must follow the map's order.
const QVDPlugInMap kPlugIns{{"/z/Z.ovx", kA}, {"/a/A.ovx", kB}, {"/m/M.ovx", kC}};
const Array kMapUuids{Value(kA), Value(kB), Value(kC)};
const Array kMapPaths{"/z/Z.ovx", "/a/A.ovx", "/m/M.ovx"};

struct WireCase {
  const char* name;
  std::function<void(QVDaemonClient&, QVDReplyHandler)> send;
  Dictionary expected;  // besides "request" and "version"
  const char* request;
};

class QVDaemonClientWire : public ::testing::Test {
 protected:
  // Sends one request and waits for its reply; answers the request the
  // daemon saw.
  Dictionary sent(const WireCase& c) {
    auto done = std::make_shared<platform::dispatch::Semaphore>();
    c.send(*client_, [done](const Result<Value>&) { done->signal(); });
    done->wait();
    return daemon_.request(++count_);
  }

  platform::mbx::testing::TemporaryRoot root_;
  qvdtest::FakeDaemon daemon_{"qvd.wire"};
  std::shared_ptr<QVDaemonClient> client_ = QVDaemonClient::initWithServiceName("qvd.wire").value();
  std::size_t count_ = 0;
};

TEST_F(QVDaemonClientWire, EveryRequestSendsExactlyItsKeys) {
  ASSERT_TRUE(daemon_.listening());
  const Dictionary environment{{"LANG", "C"}};
  const std::vector<std::string> paths{"/b/B.ovx", "/a/A.ovx"};
  const Array pathArray{"/b/B.ovx", "/a/A.ovx"};
  using S = QVDSending;
  const WireCase cases[] = {
      {"add", [&](auto& c, auto r) { c.addPlugIns(paths, r); }, {{"paths", pathArray}}, "add"},
      {"ready with environment, synchronous",
       [&](auto& c, auto r) { c.readyPlugIns(kPlugIns, S::Synchronous, 0, environment, r); },
       {{"flags", 0},
        {"environment", environment},
        {"uuids", kMapUuids},
        {"paths", kMapPaths},
        {"sync", true}},
       "ready"},
      {"find by UUID: one UUID, no array",
       [](auto& c, auto r) { c.findPlugInByUUID(kA, r); },
       {{"uuids", Value(kA)}},
       "find"},
      {"find by URL: one text",
       [](auto& c, auto r) { c.findPlugInByPathURL("file:///a/A.ovx", r); },
       {{"paths", "file:///a/A.ovx"}},
       "find"},
      {"release: a one-element array",
       [](auto& c, auto r) { c.releaseHold(kC, r); },
       {{"uuids", Array{Value(kC)}}},
       "lock"},
  };
  for (const WireCase& c : cases) {
    SCOPED_TRACE(c.name);
    Dictionary request = sent(c);
    EXPECT_EQ(request.get("request"), Value(c.request));
    EXPECT_EQ(request.get("version"), Value(3));
    request.remove("request");
    request.remove("version");
    // Value equality tells a UUID from its text and an array from a scalar.
    EXPECT_EQ(Value(request), Value(c.expected)) << Value(request).description();
  }
}

TEST_F(QVDaemonClientWire, AFindURLThatIsNotAFileURLIsRefusedBeforeSending) {
  for (const char* url : {"/a/A.ovx", "file://elsewhere/A.ovx"}) {
    SCOPED_TRACE(url);
    auto done = std::make_shared<platform::dispatch::Semaphore>();
    std::optional<platform::Error> error;
    client_->findPlugInByPathURL(url, [&, done](const Result<Value>& reply) {
      error = QVDaemonClient::errorInReply(reply);
      done->signal();
    });
    done->wait();
    ASSERT_TRUE(error);
    EXPECT_TRUE(QVErrorIs(*error, QVErrorBadPath)) << error->description();
    EXPECT_EQ(error->description(), std::string("not a file URL: ") + url);
  }
  EXPECT_TRUE(daemon_.requests().empty());
}

}  // namespace
