#include "qvd/QVDMbxClient.h"

#include <cinttypes>
#include <cstdio>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDProbes.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"

namespace qvd {

using platform::mbx::Connection;
using platform::mbx::ConnectionError;
using platform::mbx::ConnectionEvent;
using platform::mbx::Message;

QVDMbxClient::QVDMbxClient(const std::shared_ptr<Connection>& connection,
                           std::shared_ptr<QVDServer> server)
    : connection_(connection), server_(std::move(server)) {}

QVDMbxClient::~QVDMbxClient() = default;

std::shared_ptr<QVDMbxClient> QVDMbxClient::initWithConnection(
    const std::shared_ptr<Connection>& connection, std::shared_ptr<QVDServer> server) {
  QV_ASSERT_ON_QUEUE(server->mbxQueue());
  std::shared_ptr<QVDMbxClient> client(new QVDMbxClient(connection, std::move(server)));
  const platform::mbx::PeerIdentity* peer = connection->peer();
  // The listener hands over a peer it could not identify (the reason is in
  // its log): such a peer has no executable path the daemon can trust. Nor
  // has a peer whose executable file was removed or replaced since it
  // started (or never was on a file system, like a program run from a memory
  // file): grants follow the path, and the file there is not what runs.
  if (peer == nullptr || peer->executablePath().empty() || peer->executableWasReplaced()) {
    QVLogOps().log(QVDiagnosticFailureLevel(),
                   "Failed to get the file system path for the process with pid %d.",
                   peer ? static_cast<int>(peer->pid()) : 0);
    return nullptr;
  }
  const std::string& path = peer->executablePath();
  if (path.front() != '/') {
    QVLogOps().log(QVDiagnosticFailureLevel(), "Unable to get the file url from file system path.");
    return nullptr;
  }
  client->bundle_ = QVBundle::initWithExecutableURL(QVFileURLFromPath(path));
  client->path_ = path;
  QVLogOps().debug("new client %d %s", static_cast<int>(peer->pid()), path);
  probes::clientNew(static_cast<int>(peer->pid()));
  client->task_ = connection->peerIdentity();

  // The connection owns the client from here on; the client only watches
  // the connection.
  connection->setContext(client, nullptr);
  std::weak_ptr<QVDMbxClient> weak = client;
  connection->setEventHandler([weak](const ConnectionEvent& event) {
    if (auto self = weak.lock()) self->handleEvent(event);
  });
  client->server_->noteNewClient(client);
  connection->resume();
  return client;
}

int QVDMbxClient::pid() const {
  if (auto connection = connection_.lock(); connection && connection->peer()) {
    return static_cast<int>(connection->peer()->pid());
  }
  return task_ ? static_cast<int>(task_->pid()) : 0;
}

platform::Dictionary QVDMbxClient::entitlements() const {
  auto entitlements = server_->platform().entitlements->entitlementsOfExecutable(path_);
  if (!entitlements.ok()) {
    QVLogOps().error("error retrieving entitlements for client %d", pid());
    QVLogOps().debug("entitlements of %s: %@", path_, entitlements.error());
    return platform::Dictionary();
  }
  return std::move(entitlements).value();
}

platform::Value QVDMbxClient::entitlementValueForKey(std::string_view key) const {
  return entitlements().get(key);
}

bool QVDMbxClient::hasEntitlement(std::string_view key) const {
  return entitlementGranted(entitlementValueForKey(key));
}

bool entitlementGranted(const platform::Value& value) {
  if (value.isNone()) return false;
  // Property-list equality: false == 0, so both withhold the entitlement.
  return !(value == platform::Value(false));
}

bool QVDMbxClient::isSandboxed() const {
  return task_ && server_->platform().sandbox->isSandboxed(*task_);
}

std::uint32_t QVDMbxClient::requestCount() const {
  QV_ASSERT_ON_QUEUE(server_->mainQueue());
  return requestCount_;
}

std::string QVDMbxClient::description() const {
  char address[32];
  std::snprintf(address, sizeof address, "%p", static_cast<const void*>(this));
  auto connection = connection_.lock();
  if (!connection) return std::string("<QVDMbxClient ") + address + " NO CONNECTION>";
  return std::string("<QVDMbxClient ") + address + " con=" + connection->description() +
         " pid=" + std::to_string(pid()) + " path=" + path_ + ">";
}

void QVDMbxClient::handleEvent(const ConnectionEvent& event) {
  if (const auto* error = std::get_if<ConnectionError>(&event)) {
    if (*error == ConnectionError::TerminationImminent) {
      dying();
    } else {
      dead();
    }
    return;
  }
  const Message& message = std::get<Message>(event);
  if (!message.isDictionary()) {
    QVLogOps().log(QVDiagnosticFailureLevel(), "unexpected message: %{public}@ from: %d",
                   message.description(), pid());
    return;
  }
  handleRequest(message);
}

void QVDMbxClient::handleRequest(const Message& message) {
  const int peerPid = pid();
  probes::requestInput(peerPid, [&] { return message.description(); });
  auto transaction = Transaction::initWithRequestForClient(message, shared_from_this());
  const platform::Value sync = message.dictionary()->get(QVDSynchronousRequestKey);
  const Submission submission =
      sync.boolean() && *sync.boolean() ? Submission::Synchronous : Submission::Asynchronous;
  submit([self = shared_from_this(), transaction] {
    self->countAndDispatch([&] { transaction->dispatch(); });
  }, submission);
}

void QVDMbxClient::countAndDispatch(const std::function<void()>& dispatch) {
  QV_ASSERT_ON_QUEUE(server_->mainQueue());
  ++requestCount_;
  if (requestCount_ % 1000 == 0) {
    QVLogOps().debug("client %d used %u requests so far", pid(), requestCount_);
  }
  dispatch();
}

void QVDMbxClient::submit(std::function<void()> work, Submission submission) {
  if (submission == Submission::Asynchronous) {
    server_->submitWork(std::move(work), Submission::Asynchronous);
    return;
  }
  QVLogOps().debug("submitting block to main queue synchronously");
  // Waiting here would hold a pool thread for every connection whose
  // request sits in the service queue's backlog. The order the wait gives
  // is kept instead: later requests queue behind this one anyway, and the
  // death waits until it has run (finishDeath).
  syncOutstanding_.fetch_add(1);
  server_->submitWork(
      [self = shared_from_this(), work = std::move(work)] {
        work();
        if (self->syncOutstanding_.fetch_sub(1) == 1 && self->deathPending_.exchange(false)) {
          self->finishDeath();
        }
      },
      Submission::Asynchronous);
}

void QVDMbxClient::dying() { QVLogOps().debug("client %d termination imminent", pid()); }

void QVDMbxClient::dead() {
  deathPending_.store(true);
  if (syncOutstanding_.load() == 0 && deathPending_.exchange(false)) finishDeath();
}

void QVDMbxClient::finishDeath() {
  acceptWork_.store(false);
  // Told once its holds are gone, so that "dead" in the log means done.
  const int peerPid = pid();
  server_->unholdClient(shared_from_this(), [peerPid] {
    QVLogOps().debug("client %d is dead", peerPid);
    probes::clientDone(peerPid);
  });
}

}  // namespace qvd
