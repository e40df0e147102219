// QVDaemonClient: creation, the connection and sending. The requests are in
// QVDaemonClientRequests.cpp, the reading of replies in
// QVDaemonClientReplies.cpp.
#include "Quorvex/QVDaemonClient.h"

#include <variant>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"
#include "platform/mbx/MbxError.h"

namespace {

using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Value;
using platform::mbx::Connection;
using platform::mbx::ConnectionError;
using platform::mbx::ConnectionEvent;
using platform::mbx::Message;

constexpr std::string_view kReplyQueueLabel = "qvd_client";

std::string describeEvent(const ConnectionEvent& event) {
  if (const auto* error = std::get_if<ConnectionError>(&event)) {
    return platform::mbx::connectionErrorName(*error);
  }
  return std::get<Message>(event).description();
}

// The handler as the caller gave it, behind the reply's traffic log line.
QVDReplyHandler loggingReply(QVDReplyHandler reply) {
  return [reply = std::move(reply)](const Result<Value>& outcome) {
    if (outcome.ok()) {
      QVLogTraffic().debug("reply: %@", outcome.value());
    } else {
      QVLogTraffic().debug("reply: %@", outcome.error());
    }
    if (reply) reply(outcome);
  };
}

Result<Value> bodyOf(Result<Message> outcome) {
  if (!outcome.ok()) return outcome.error();
  return outcome.value().body();
}

}  // namespace

QVDaemonClient::QVDaemonClient(std::string serviceName)
    : serviceName_(std::move(serviceName)),
      replyQueue_(platform::dispatch::SerialQueue::create(kReplyQueueLabel)),
      protocolVersion_(QVDProtocolVersion),
      closing_(std::make_shared<std::atomic<bool>>(false)) {}

Result<std::shared_ptr<QVDaemonClient>> QVDaemonClient::initWithServiceName(
    std::optional<std::string_view> serviceName) {
  std::shared_ptr<QVDaemonClient> client(
      new QVDaemonClient(std::string(serviceName.value_or(QVDServiceName))));
  std::lock_guard<std::mutex> lock(client->mu_);
  Result<std::shared_ptr<Connection>> connected = client->connectLocked();
  if (!connected.ok()) {
    if (platform::mbx::errorCodeOf(connected.error()) == platform::mbx::ErrorCode::BadServiceName) {
      return connected.error();
    }
    // Not fatal: the daemon may start later, and every request reports the
    // failure to its own handler.
    QVLogOps().info("cannot reach %{public}s yet: %{public}@", client->serviceName_,
                    connected.error());
  }
  return client;
}

QVDaemonClient::~QVDaemonClient() {
  closing_->store(true);
  // No lock: nothing else can reach a client that is being destroyed.
  if (qvd_) qvd_->cancel();
}

Result<std::shared_ptr<Connection>> QVDaemonClient::connection() {
  std::lock_guard<std::mutex> lock(mu_);
  if (qvd_) return qvd_;
  return connectLocked();
}

Result<std::shared_ptr<Connection>> QVDaemonClient::connectLocked() {
  // Connecting holds the lock: concurrent first requests share one
  // connection instead of racing to make several. A local connect() is
  // quick unless the daemon's backlog is full.
  // Replies carry whole plug-in forms, a few hundred values each, so a
  // match answering thousands of plug-ins holds far more values than any
  // request may. The body stays within the wire's byte limit either way.
  platform::mbx::ConnectionLimits limits;
  limits.frame.maxItems = kMaxReplyItems;
  Result<std::shared_ptr<Connection>> made = Connection::connectToService(serviceName_, limits);
  if (!made.ok()) return made.error();
  std::shared_ptr<Connection> connection = made.value();
  // Weak references only: the connection holds its handler until it ends,
  // and must not keep the client (or itself) alive through it.
  std::weak_ptr<QVDaemonClient> weakSelf = weak_from_this();
  std::weak_ptr<Connection> weakConnection = connection;
  connection->setEventHandler([weakSelf, weakConnection, closing = closing_,
                               queue = replyQueue_](const ConnectionEvent& event) {
    const auto* error = std::get_if<ConnectionError>(&event);
    if (error != nullptr && *error == ConnectionError::Invalid) {
      auto self = weakSelf.lock();
      auto ended = weakConnection.lock();
      // A connection nobody holds any more is not the client's current one.
      if (self && ended) self->forget(ended.get());
    }
    if (closing->load()) return;
    // Replies do not come this way; whatever does is unexpected.
    queue->async([text = describeEvent(event)] {
      QVLogOps().error("Communications error: %{public}@", text);
    });
  });
  connection->resume();
  qvd_ = connection;
  return connection;
}

void QVDaemonClient::forget(const Connection* ended) {
  std::lock_guard<std::mutex> lock(mu_);
  if (qvd_.get() == ended) qvd_.reset();
}

void QVDaemonClient::failLater(Error error, QVDReplyHandler reply) {
  replyQueue_->async([error = std::move(error), reply = std::move(reply)] { reply(error); });
}

void QVDaemonClient::send(Dictionary message, QVDReplyHandler reply) {
  sendSynchronously(QVDSending::Asynchronous, std::move(message), std::move(reply));
}

void QVDaemonClient::sendSynchronously(QVDSending sending, Dictionary message,
                                       QVDReplyHandler reply) {
  if (sending == QVDSending::Synchronous) message.set(QVDSynchronousRequestKey, true);
  Value body(std::move(message));
  QVLogTraffic().debug("request: %@", body);
  QVDReplyHandler logged = loggingReply(std::move(reply));
  Result<std::shared_ptr<Connection>> connected = connection();
  if (sending == QVDSending::Synchronous) {
    if (!connected.ok()) {
      logged(connected.error());
      return;
    }
    logged(bodyOf(connected.value()->sendWithReplySync(std::move(body))));
    return;
  }
  if (!connected.ok()) {
    failLater(connected.error(), std::move(logged));
    return;
  }
  connected.value()->sendWithReply(std::move(body), replyQueue_,
                                   [logged = std::move(logged)](Result<Message> outcome) {
                                     logged(bodyOf(std::move(outcome)));
                                   });
}
