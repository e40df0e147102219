#include "tests/unit/qvd/QvdTestSupport.h"

#include <stdlib.h>

#include <filesystem>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "platform/root/Root.h"

namespace qvd::testing {

// One root per process: the dispatch pool's threads outlive each test.
const std::string& testRoot() {
  static const std::string root = [] {
    char pattern[] = "/tmp/qvd-test-XXXXXX";
    std::string path = ::mkdtemp(pattern);
    platform::setRootDirectoryForTesting(path);
    ::setenv("QV_ROOT", path.c_str(), 1);
    return path;
  }();
  return root;
}

std::string selfExecutable() {
  return std::filesystem::read_symlink("/proc/self/exe").string();
}

Platform FakePlatform::platform() const {
  return Platform{.entitlements = entitlements, .sandbox = sandbox, .preferences = preferences,
                  .notifications = notifications, .containers = containers, .registry = registry,
                  .locale = locale, .extensions = extensions, .types = types,
                  .serviceManager = serviceManager, .assertions = assertions,
                  .consents = consents};
}

bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  while (!done()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(2ms);
  }
  return true;
}

TestServer::TestServer() : TestServer([](Platform&) {}) {}

TestServer::TestServer(const std::function<void(Platform&)>& adjust) {
  (void)testRoot();
  static std::atomic<int> serial{0};
  serviceName_ = "qvd.test." + std::to_string(::getpid()) + "." + std::to_string(++serial);
  Platform services = fakes_.platform();
  adjust(services);
  server_ = QVDServer::initForService(serviceName_, std::nullopt, std::move(services),
                                      TerminationSignal::NotWatched);
  if (!server_) return;
  server_->setClientObserverForTesting([this](std::shared_ptr<QVDMbxClient> client) {
    std::lock_guard<std::mutex> lock(mu_);
    clients_.push_back(std::move(client));
  });
  server_->resumeForTesting();
}

TestServer::~TestServer() {
  if (server_) server_->stop();
  QVDServer::resetForTesting();
}

std::vector<std::shared_ptr<QVDMbxClient>> TestServer::clients() const {
  std::lock_guard<std::mutex> lock(mu_);
  return clients_;
}

TestClient::TestClient(const TestServer& server)
    : replyQueue_(platform::dispatch::SerialQueue::create("test.replies")) {
  auto connection = platform::mbx::Connection::connectToService(server.serviceName());
  if (!connection.ok()) return;
  connection_ = std::move(connection).value();
  connection_->setEventHandler([](const platform::mbx::ConnectionEvent&) {});
  connection_->resume();
}

TestClient::~TestClient() {
  if (connection_) connection_->cancel();
}

platform::Result<platform::Value> TestClient::call(const platform::Dictionary& request) {
  if (!connection_) return platform::Error("test", 1, "not connected");
  auto reply = connection_->sendWithReplySync(platform::Value(request));
  if (!reply.ok()) return reply.error();
  return reply->body();
}

void TestClient::callAsync(const platform::Dictionary& request) {
  // The handler may outlive this object, so it counts in shared state.
  connection_->sendWithReply(platform::Value(request), replyQueue_,
                             [replies = replies_](platform::Result<platform::mbx::Message>) {
                               ++*replies;
                             });
}

platform::Dictionary request(std::string_view name) {
  platform::Dictionary message;
  message.set(QVDRequestKey, std::string(name));
  message.set(QVDVersionKey, QVDProtocolVersion);
  return message;
}

ErrorReply errorOf(const platform::Value& reply) {
  ErrorReply error;
  const platform::Dictionary* body = reply.dictionary();
  if (body == nullptr) return {~0ull, "not a dictionary"};
  error.code = body->get(QVDErrorCodeKey).uint64().value_or(0);
  if (const std::string* text = body->get(QVDErrorKey).string()) error.message = *text;
  return error;
}

}  // namespace qvd::testing
