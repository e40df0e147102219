// An in-process daemon for tests: a server on a temporary root with fake
// platform services, and clients over real connections.
#pragma once

#include <atomic>
#include <functional>
#include <chrono>
#include <memory>
#include <mutex>
#include <ostream>
#include <string>
#include <vector>

#include "platform/codesign/testing/FakeEntitlementStore.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/holvane/testing/FakeRegistry.h"
#include "platform/locale/testing/FakeLocaleService.h"
#include "platform/lumend/testing/FakeServiceManager.h"
#include "platform/mbx/Connection.h"
#include "platform/notify/testing/FakeNotificationCenter.h"
#include "platform/prefs/testing/FakePreferenceStore.h"
#include "platform/pvg/testing/FakeConsentService.h"
#include "platform/sandbox/testing/FakeSandboxCheck.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"
#include "platform/types/testing/FakeTypeRegistry.h"
#include "platform/values/Dictionary.h"
#include "platform/vouchd/testing/FakeAssertionService.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDServer.h"

namespace qvd::testing {

using namespace std::chrono_literals;

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
  std::shared_ptr<platform::types::FakeTypeRegistry> types =
      std::make_shared<platform::types::FakeTypeRegistry>();
  std::shared_ptr<platform::lumend::FakeServiceManager> serviceManager =
      std::make_shared<platform::lumend::FakeServiceManager>();
  std::shared_ptr<platform::vouchd::FakeAssertionService> assertions =
      std::make_shared<platform::vouchd::FakeAssertionService>();
  std::shared_ptr<platform::pvg::FakeConsentService> consents =
      std::make_shared<platform::pvg::FakeConsentService>();
  Platform platform() const;
};

// This test program's executable: what a fake grant names to entitle the
// test's own connections.
std::string selfExecutable();

// The temporary platform root of this process, made and set on first use.
const std::string& testRoot();

bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit = 10s);

// A server under a service name of its own. Records every client it makes.
class TestServer {
 public:
  TestServer();
  explicit TestServer(const std::function<void(Platform&)>& adjust);
  ~TestServer();

  const std::shared_ptr<QVDServer>& server() const { return server_; }
  FakePlatform& fakes() { return fakes_; }
  const std::string& serviceName() const { return serviceName_; }
  std::vector<std::shared_ptr<QVDMbxClient>> clients() const;

 private:
  FakePlatform fakes_;
  std::string serviceName_;
  std::shared_ptr<QVDServer> server_;
  mutable std::mutex mu_;
  std::vector<std::shared_ptr<QVDMbxClient>> clients_;
};

class TestClient {
 public:
  explicit TestClient(const TestServer& server);
  ~TestClient();

  // The reply body, or the connection's error.
  platform::Result<platform::Value> call(const platform::Dictionary& request);
  // Sends `request`; replies are counted as they arrive.
  void callAsync(const platform::Dictionary& request);
  std::size_t asyncReplyCount() const { return replies_->load(); }

  void cancel() { connection_->cancel(); }
  const std::shared_ptr<platform::mbx::Connection>& connection() const { return connection_; }

 private:
  std::shared_ptr<platform::mbx::Connection> connection_;
  std::shared_ptr<platform::dispatch::SerialQueue> replyQueue_;
  const std::shared_ptr<std::atomic<std::size_t>> replies_ =
      std::make_shared<std::atomic<std::size_t>>(0);
};

platform::Dictionary request(std::string_view name);
// The "errorcode" and "error" of a reply ({0, ""} for a success).
struct ErrorReply {
  std::uint64_t code = 0;
  std::string message;
  bool operator==(const ErrorReply&) const = default;
};
inline void PrintTo(const ErrorReply& e, std::ostream* os) { *os << e.code << " \"" << e.message << "\""; }
ErrorReply errorOf(const platform::Value& reply);

}  // namespace qvd::testing
