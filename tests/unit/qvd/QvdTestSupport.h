// An in-process daemon for tests: a server on a temporary platform root with
// fake platform services, and clients that speak to it over real
// connections.
#pragma once

#include <atomic>
#include <functional>
#include <chrono>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/codesign/testing/FakeEntitlementStore.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/holvane/testing/FakeRegistry.h"
#include "platform/locale/testing/FakeLocaleService.h"
#include "platform/mbx/Connection.h"
#include "platform/notify/testing/FakeNotificationCenter.h"
#include "platform/prefs/testing/FakePreferenceStore.h"
#include "platform/sandbox/testing/FakeSandboxCheck.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"
#include "platform/values/Dictionary.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDServer.h"

namespace qvd::testing {

using namespace std::chrono_literals;

// The fakes behind a test server, kept so that tests can set their answers.
struct FakePlatform {
  std::shared_ptr<platform::codesign::FakeEntitlementStore> entitlements =
      std::make_shared<platform::codesign::FakeEntitlementStore>();
  std::shared_ptr<platform::sandbox::FakeSandboxCheck> sandbox =
      std::make_shared<platform::sandbox::FakeSandboxCheck>();
  std::shared_ptr<platform::prefs::FakePreferenceStore> preferences =
      std::make_shared<platform::prefs::FakePreferenceStore>();
  std::shared_ptr<platform::notify::FakeNotificationCenter> notifications =
      std::make_shared<platform::notify::FakeNotificationCenter>();
  std::shared_ptr<platform::container::FakeContainerManager> containers =
      std::make_shared<platform::container::FakeContainerManager>();
  std::shared_ptr<platform::holvane::FakeRegistry> registry =
      std::make_shared<platform::holvane::FakeRegistry>();
  std::shared_ptr<platform::locale::FakeLocaleService> locale =
      std::make_shared<platform::locale::FakeLocaleService>();
  std::shared_ptr<platform::sandbox::FakeSandboxExtensions> extensions =
      std::make_shared<platform::sandbox::FakeSandboxExtensions>();
  Platform platform() const;
};

// The temporary platform root of this test process, made (and set as the
// root) on first use. Call it before computing any path under the root.
const std::string& testRoot();

// Polls `done` until it holds or `limit` passes.
bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit = 10s);

// A server listening under a service name of its own, on the process's
// temporary root (made once per process). Records every client it makes.
class TestServer {
 public:
  TestServer();
  // With some fakes replaced by real services before the server is made.
  explicit TestServer(const std::function<void(Platform&)>& adjust);
  ~TestServer();

  const std::shared_ptr<QVDServer>& server() const { return server_; }
  FakePlatform& fakes() { return fakes_; }
  const std::string& serviceName() const { return serviceName_; }
  // The clients made so far, in order.
  std::vector<std::shared_ptr<QVDMbxClient>> clients() const;

 private:
  FakePlatform fakes_;
  std::string serviceName_;
  std::shared_ptr<QVDServer> server_;
  mutable std::mutex mu_;
  std::vector<std::shared_ptr<QVDMbxClient>> clients_;
};

// A connection to a TestServer.
class TestClient {
 public:
  explicit TestClient(const TestServer& server);
  ~TestClient();

  // Sends `request` and waits for its reply: the reply body, or the
  // connection's error.
  platform::Result<platform::Value> call(const platform::Dictionary& request);
  // Sends `request` with a reply handler that records the reply (or error)
  // in arrival order.
  void callAsync(const platform::Dictionary& request);
  std::vector<platform::Result<platform::Value>> asyncReplies() const;
  std::size_t asyncReplyCount() const;

  void cancel() { connection_->cancel(); }
  const std::shared_ptr<platform::mbx::Connection>& connection() const { return connection_; }

 private:
  std::shared_ptr<platform::mbx::Connection> connection_;
  std::shared_ptr<platform::dispatch::SerialQueue> replyQueue_;
  struct Replies {
    std::mutex mu;
    std::vector<platform::Result<platform::Value>> list;
  };
  const std::shared_ptr<Replies> replies_ = std::make_shared<Replies>();
};

// A request of `name` at the current protocol version.
platform::Dictionary request(std::string_view name);
// The "errorcode" and "error" of a reply ({0, ""} for a success).
struct ErrorReply {
  std::uint64_t code = 0;
  std::string message;
  bool operator==(const ErrorReply&) const = default;
};
ErrorReply errorOf(const platform::Value& reply);

}  // namespace qvd::testing
