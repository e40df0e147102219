#include "qvd/QVDServer.h"

#include <signal.h>
#include <unistd.h>

#include <cstdio>
#include <mutex>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"
#include "platform/dispatch/MainQueue.h"
#include "platform/mbx/MbxError.h"
#include "qvd/QVDMbxClient.h"

namespace qvd {

namespace {

std::mutex gServerMu;
std::shared_ptr<QVDServer> gServer;  // guarded by gServerMu; set once per process

}  // namespace

QVDServer::QVDServer(std::string serviceName, Platform platform)
    : serviceName_(std::move(serviceName)),
      platform_(std::move(platform)),
      mbxQueue_(platform::dispatch::SerialQueue::create("mbx")),
      mainQueue_(platform::dispatch::SerialQueue::create(
          "service", platform::dispatch::Priority::UserInitiated)),
      syncQueue_(platform::dispatch::SerialQueue::create("serverSync")),
      terminationAction_([] {
        std::fflush(nullptr);
        ::_exit(0);
      }) {}

QVDServer::~QVDServer() {
  if (sigSource_) sigSource_->cancel();
  if (service_) service_->cancel();
}

std::shared_ptr<QVDServer> QVDServer::initForService(std::string serviceName,
                                                     std::optional<std::string> databasePath,
                                                     Platform platform, TerminationSignal signal) {
  auto server = std::make_shared<QVDServer>(std::move(serviceName), std::move(platform));
  if (platform::Status status = server->initDatabase(std::move(databasePath), server->platform_);
      !status.ok()) {
    // Without a place for the user's choices the daemon does not run.
    const std::string* text = status.error().localizedDescription();
    QVLogOps().error("%{public}s", text ? *text : status.error().description());
    return nullptr;
  }
  auto listener = platform::mbx::Listener::create(server->serviceName_, server->mbxQueue_);
  if (!listener.ok()) {
    QVLogOps().error("cannot listen on %{public}s: %@", server->serviceName_, listener.error());
    return nullptr;
  }
  server->service_ = std::move(listener).value();
  {
    std::lock_guard<std::mutex> lock(gServerMu);
    gServer = server;
  }
  // The database tells its delegate, the server, of uninstalls (held
  // weakly by the database).
  server->setDelegate(server);
  std::weak_ptr<QVDServer> weak = server;
  server->service_->setEventHandler([weak](const platform::mbx::Listener::Event& event) {
    if (auto self = weak.lock()) self->handleListenerEvent(event);
  });
  server->userPrefs_ = std::make_unique<QVDUserPrefs>(server->platform_.preferences);
  if (signal == TerminationSignal::NotWatched) return server;

  auto source = platform::dispatch::SignalSource::create(
      "qvd.sigterm", SIGTERM, platform::dispatch::Priority::UserInitiated,
      platform::dispatch::MainQueue::instance(), [weak] {
        // Weak: the handler must not be what keeps a server alive.
        if (auto self = weak.lock()) self->terminate();
      });
  if (!source.ok()) {
    QVLogOps().error("cannot watch SIGTERM: %{public}s", source.message());
    forgetInstance();  // no half-made server stays reachable
    return nullptr;
  }
  server->sigSource_ = std::move(source).value();
  server->sigSource_->resume();
  return server;
}

std::shared_ptr<QVDServer> QVDServer::server() {
  std::lock_guard<std::mutex> lock(gServerMu);
  return gServer;
}

void QVDServer::forgetInstance() {
  std::lock_guard<std::mutex> lock(gServerMu);
  gServer.reset();
}

void QVDServer::resetForTesting() {
  forgetInstance();
}

void QVDServer::setTerminationActionForTesting(std::function<void()> action) {
  terminationAction_ = std::move(action);
}

void QVDServer::setClientObserverForTesting(
    std::function<void(std::shared_ptr<QVDMbxClient>)> observer) {
  clientObserver_ = std::move(observer);
}

void QVDServer::noteNewClient(const std::shared_ptr<QVDMbxClient>& client) {
  QV_ASSERT_ON_QUEUE(mbxQueue_);
  if (clientObserver_) clientObserver_(client);
}

void QVDServer::run() {
  service_->resume();
  platform::dispatch::runMainLoop();
  // The loop is only quit by tests; a daemon that gets here has nothing to
  // serve any more.
  std::fflush(nullptr);
  ::_exit(0);
}

void QVDServer::resumeForTesting() {
  service_->resume();
}

void QVDServer::terminate() {
  stop();
  terminationAction_();
}

void QVDServer::handleListenerEvent(const platform::mbx::Listener::Event& event) {
  QV_ASSERT_ON_QUEUE(mbxQueue_);
  if (const auto* connection = std::get_if<std::shared_ptr<platform::mbx::Connection>>(&event)) {
    auto client = QVDMbxClient::initWithConnection(*connection, shared_from_this());
    if (!client) (*connection)->cancel();
    return;
  }
  const auto& error = std::get<platform::Error>(event);
  if (error.is(platform::mbx::kErrorDomain,
               static_cast<std::int64_t>(platform::mbx::ErrorCode::ConnectionInvalid))) {
    QVLogOps().notice("potentially unexpected error from mbx: %{public}@", error);
  } else {
    QVLogOps().error("unexpected error from mbx: %{public}@", error);
  }
}

void QVDServer::stop() {
  service_->cancel();
  syncQueue_->sync([this] {
    for (const auto& hold : holds_) {
      QVLogOps().debug("releasing plug-in hold %{public}@ because server is stopping",
                       hold->uuid());
    }
    holds_.clear();
    notifyAnnotationChange();
  });
}

void QVDServer::submitWork(std::function<void()> work, Submission submission) {
  if (submission == Submission::Asynchronous) {
    // Requests come from their connection's event handler, which returns
    // right after: its thread serves the queue next instead of waking
    // another one, which would cost a thread switch per request.
    mainQueue_->asyncAfterCaller(std::move(work));
    return;
  }
  QVLogOps().debug("submitting block to main queue synchronously");
  mainQueue_->sync(std::move(work));
}

// The hold operations are in QVDServerHolds.cpp.

}  // namespace qvd
