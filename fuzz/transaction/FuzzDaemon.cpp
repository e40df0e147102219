#include "fuzz/transaction/FuzzDaemon.h"

#include <stdlib.h>

#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>

#include "Quorvex/QVDConstants.h"
#include "fuzz/transaction/StatelessServices.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "qvd/QVDMbxClient.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::fuzzing {

namespace {

using platform::Dictionary;
using platform::Value;

[[noreturn]] void die(const char* why) {
  std::fprintf(stderr, "fuzz_transaction: %s\n", why);
  std::abort();
}

std::string replaceRoot(std::string text, const std::string& root) {
  static constexpr std::string_view kToken = "$ROOT";
  for (std::size_t at = text.find(kToken); at != std::string::npos;
       at = text.find(kToken, at + root.size())) {
    text.replace(at, kToken.size(), root);
  }
  return text;
}

// The root is this process's own; long fuzzing sessions start many.
void removeRoot() {
  std::error_code ignored;
  std::filesystem::remove_all(platform::rootDirectory(), ignored);
}

}  // namespace

ClientSettings ClientSettings::fromByte(std::uint8_t byte) {
  return ClientSettings{.manager = (byte & 0x01) != 0,
                        .environment = (byte & 0x02) != 0,
                        .restricted = (byte & 0x04) != 0,
                        .flag = (byte & 0x08) != 0,
                        .sandboxed = (byte & 0x10) != 0,
                        .unreadable = (byte & 0x20) != 0,
                        .badRestriction = (byte & 0x40) != 0};
}

FuzzDaemon& FuzzDaemon::instance() {
  static FuzzDaemon* daemon = new FuzzDaemon();
  return *daemon;
}

FuzzDaemon::FuzzDaemon() {
  // Everything is logged, private arguments too, into a capture: the
  // formatting of request values is part of serving them. A QV_LOG of the
  // caller's own wins.
  ::setenv("QV_LOG", "debug", 0);
  ::setenv("QV_LOG_PRIVATE", "1", 0);
  platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
  (void)testing::testRoot();
  std::atexit(removeRoot);
  self_ = testing::selfExecutable();
  catalogue_ = makePlugInCatalogue();

  server_ = new testing::TestServer([](Platform& services) {
    services.serviceManager = std::make_shared<StatelessServiceManager>();
    services.extensions = std::make_shared<StatelessSandboxExtensions>();
    services.assertions = std::make_shared<StatelessAssertionService>();
    services.consents = std::make_shared<StatelessConsentService>();
    services.containers =
        std::make_shared<StatelessContainerManager>(platform::rootPath("var/containers/User"));
  });
  if (!server_->server()) die("the server cannot be made");
  platform::holvane::ApplicationRecord application;
  application.path = platform::rootPath("Applications/Host.app");
  application.bundleIdentifier = "com.example.host";
  application.executablePath = application.path + "/Host";
  application.info = Dictionary{{"BXBundleIdentifier", "com.example.host"}, {"BXExecutable", "Host"}};
  server_->fakes().registry->putApplication(application);
  for (const auto& record : catalogue_) server_->fakes().registry->put(record);

  client_ = new testing::TestClient(*server_);
  if (!client_->connection()) die("the client cannot connect");
  auto first = client_->call(testing::request(QVDBulkRequest));
  if (!first.ok() || server_->clients().size() != 1) die("the first request was not served");
  peer_ = server_->clients().front();
}

void FuzzDaemon::apply(const ClientSettings& settings) {
  auto& entitlements = *server_->fakes().entitlements;
  entitlements.clear();
  if (settings.unreadable) {
    entitlements.failExecutable(self_, platform::Error("fuzz", 1, "entitlements unreadable"));
  } else {
    Dictionary granted;
    if (settings.manager) granted.set(QVManagerEntitlement, true);
    if (settings.environment) granted.set(QVEnvironmentProvisionEntitlement, true);
    if (settings.flag) granted.set("com.example.flag", true);
    if (settings.badRestriction) {
      granted.set(QVAllowedPlugInsEntitlement, "not a rule set");
    } else if (settings.restricted) {
      granted.set(QVAllowedPlugInsEntitlement,
                  Dictionary{{"XOExtensionIdentifier",
                              platform::Array{"com.example.alpha", "com.example.beta"}}});
    }
    entitlements.setExecutableEntitlements(self_, std::move(granted));
  }
  server_->fakes().sandbox->setDefault(settings.sandboxed
                                           ? platform::sandbox::Sandboxing::Sandboxed
                                           : platform::sandbox::Sandboxing::NotSandboxed);
}

bool PendingReply::waitFor(std::chrono::milliseconds limit) {
  if (done_.load()) return true;
  if (arrived_.waitFor(limit) != platform::dispatch::WaitResult::Succeeded) return false;
  done_.store(true);
  return true;
}

std::shared_ptr<PendingReply> FuzzDaemon::send(Value request) {
  static const auto replies = platform::dispatch::SerialQueue::create("fuzz.replies");
  auto pending = std::make_shared<PendingReply>();
  client_->connection()->sendWithReply(std::move(request), replies,
                                       [pending](platform::Result<platform::mbx::Message> reply) {
                                         pending->reply_ = std::move(reply);
                                         pending->arrived_.signal();
                                       });
  return pending;
}

std::string FuzzDaemon::connectionState() const {
  const auto& mine = client_->connection();
  std::string state = "client: " + std::to_string(mine->pendingReplyCountForTesting()) +
                      " awaiting replies, " + std::to_string(mine->queuedOutputBytesForTesting()) +
                      " bytes queued";
  if (auto theirs = peer_->connection()) {
    state += "; daemon: " + std::to_string(theirs->pendingReplyCountForTesting()) +
             " awaiting replies, " + std::to_string(theirs->queuedOutputBytesForTesting()) +
             " bytes queued";
  } else {
    state += "; the daemon's end is gone";
  }
  return state + "; client accepts work: " + (peer_->acceptWork() ? "yes" : "no");
}

void FuzzDaemon::drainServiceQueue() { server_->server()->mainQueue()->sync([] {}); }

void FuzzDaemon::restore() {
  if (!server_->server()->holds().empty()) server_->server()->unholdClient(peer_);
  for (const auto& record : catalogue_) {
    auto found = server_->fakes().registry->plugInByUuid(record.uuid);
    if (!found.ok() || !*found) server_->fakes().registry->put(record);
  }
}

Value FuzzDaemon::withRoot(const Value& request) const {
  const Dictionary* body = request.dictionary();
  if (body == nullptr) return request;
  const std::string& root = platform::rootDirectory();
  Dictionary rewritten;
  rewritten.reserve(body->size());
  for (const auto& [key, value] : *body) {
    if (const std::string* text = value.string()) {
      rewritten.set(key, replaceRoot(*text, root));
    } else if (const platform::Array* list = value.array()) {
      platform::Array elements;
      elements.reserve(list->size());
      for (const Value& element : *list) {
        const std::string* item = element.string();
        elements.append(item ? Value(replaceRoot(*item, root)) : element);
      }
      rewritten.set(key, std::move(elements));
    } else {
      rewritten.set(key, value);
    }
  }
  return Value(std::move(rewritten));
}

}  // namespace qvd::fuzzing
