// Connection: creation, life cycle and the incoming half (reading, frame
// handling, delivery). The outgoing half is in ConnectionSending.cpp.
#include "platform/mbx/Connection.h"

#include <sys/socket.h>

#include <cerrno>
#include <optional>

#include "platform/mbx/MbxError.h"
#include "platform/mbx/internal/MbxLog.h"
#include "platform/mbx/internal/ServiceSocket.h"

namespace platform::mbx {

using internal::mbxLog;
using internal::PendingReply;

namespace {

std::atomic<std::uint64_t> gNextSerial{0};

std::string queueLabel(std::string_view serviceName, std::uint64_t serial) {
  std::string label = "com.corvane.mbx.";
  label += serviceName;
  label += '#';
  label += std::to_string(serial);
  return label;
}

unsigned long long ull(std::uint64_t value) {
  return static_cast<unsigned long long>(value);
}

}  // namespace

const char* connectionErrorName(ConnectionError error) {
  switch (error) {
    case ConnectionError::Invalid:
      return "connection invalid";
    case ConnectionError::TerminationImminent:
      return "termination imminent";
  }
  return "unknown";
}

Connection::Connection(std::string_view serviceName, std::shared_ptr<internal::SocketHandle> socket,
                       std::shared_ptr<const PeerIdentity> peer, ConnectionLimits limits)
    : serviceName_(serviceName),
      serial_(gNextSerial.fetch_add(1, std::memory_order_relaxed) + 1),
      limits_(limits),
      peer_(std::move(peer)),
      queue_(dispatch::SerialQueue::create(queueLabel(serviceName, serial_))),
      fd_(socket->fd()),
      reader_(limits.frame),
      socket_(std::move(socket)) {}

Result<std::shared_ptr<Connection>> Connection::adopt(std::string_view serviceName, int fd,
                                                      std::shared_ptr<const PeerIdentity> peer,
                                                      const ConnectionLimits& limits) {
  auto socket = std::make_shared<internal::SocketHandle>(fd);
  std::shared_ptr<Connection> connection(
      new Connection(serviceName, socket, std::move(peer), limits));
  std::weak_ptr<Connection> weak = connection;
  // The source holds the connection weakly: only resume() keeps it alive on
  // its own, so a connection nobody resumed or kept goes away.
  using Readiness = dispatch::FdSource::Readiness;
  auto source = dispatch::FdSource::createTwoWay(
      connection->queue_->label(), dispatch::Priority::Default, fd, connection->queue_,
      [weak] {
        auto self = weak.lock();
        return self ? self->onReadable() : Readiness::Drained;
      },
      [weak] {
        auto self = weak.lock();
        return self ? self->onWritable() : Readiness::Drained;
      });
  if (!source) return makeError(ErrorCode::SocketFailure, source.message());
  // The source keeps the descriptor open until the reactor has let go of it.
  source.value()->setCancelHandler([socket] { (void)socket; });
  connection->source_ = std::move(source).value();
  return connection;
}

Result<std::shared_ptr<Connection>> Connection::connectToService(std::string_view serviceName,
                                                                 ConnectionLimits limits) {
  Result<std::string> path = internal::servicePath(serviceName);
  if (!path.ok()) return path.error();
  Result<int> fd = internal::connectTo(path.value());
  if (!fd.ok()) return fd.error();
  return adopt(serviceName, fd.value(), nullptr, limits);
}

Connection::~Connection() {
  if (source_) source_->cancel();
  // Only a connection that was never resumed, or whose invalidation has run,
  // gets here; in the first case its requests and context are still held.
  std::vector<PendingReply> pending;
  {
    std::lock_guard<std::mutex> lock(pendingMu_);
    pending = pending_.takeAll();
  }
  for (PendingReply& reply : pending) {
    std::move(reply).complete(makeError(ErrorCode::ConnectionInvalid, "connection destroyed"));
  }
  if (finalizer_) finalizer_(std::move(context_));
}

void Connection::setEventHandler(EventHandler handler) {
  std::lock_guard<std::mutex> lock(mu_);
  if (state_ != State::Suspended) {
    mbxLog().fault("%{public}s: event handler set after resume() or cancel(); ignored",
                   description());
    return;
  }
  handler_ = std::move(handler);
}

void Connection::resume() {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (state_ != State::Suspended || closing_) return;
    state_ = State::Active;
    selfWhileActive_ = shared_from_this();
  }
  source_->resume(dispatch::FdSource::Event::Readable);
}

void Connection::cancel() {
  if (cancelled_.exchange(true)) return;
  queue_->async([self = shared_from_this()] { self->invalidate(); });
}

dispatch::FdSource::Readiness Connection::onReadable() {
  using Readiness = dispatch::FdSource::Readiness;
  // Once the connection ends its source is cancelled: what it answers no
  // longer matters.
  if (invalidated_) return Readiness::Drained;
  std::uint8_t chunk[ConnectionLimits::kReadChunkBytes];
  for (int reads = 0; reads < limits_.maxReadsPerTurn; ++reads) {
    ssize_t n = ::recv(fd_, chunk, sizeof chunk, MSG_DONTWAIT);
    const int err = n < 0 ? errno : 0;
    if (err == EINTR) continue;
    if (err == EAGAIN || err == EWOULDBLOCK) return Readiness::Drained;
    if (consumeReceived(n, err, chunk, PendingReply::Caller::ReturnsToPool) == Received::Ended) {
      return Readiness::Drained;
    }
    // A short read of a stream socket means it was emptied: whatever comes
    // next is a new arrival, and the source reports it.
    if (static_cast<std::size_t>(n) < sizeof chunk) return Readiness::Drained;
  }
  // Stopped to let other connections have the pool: more may be waiting.
  return Readiness::MayRemain;
}

Connection::Received Connection::consumeReceived(ssize_t n, int err, const std::uint8_t* bytes,
                                                 PendingReply::Caller reader) {
  QV_ASSERT_ON_QUEUE(queue_);
  if (invalidated_) return Received::Ended;
  if (cancelled_.load(std::memory_order_relaxed)) {
    invalidate();
    return Received::Ended;
  }
  if (n < 0) {
    mbxLog().info("%{public}s: closing: read failed: %{errno}d", description(), err);
    invalidate();
    return Received::Ended;
  }
  if (n == 0) {
    if (Status ended = reader_.finish(); !ended.ok()) {
      logBrokenFrame(ended.error());
    } else {
      mbxLog().debug("%{public}s: the peer closed the connection", description());
    }
    invalidate();
    return Received::Ended;
  }
  std::span<const std::uint8_t> input(bytes, static_cast<std::size_t>(n));
  while (!input.empty()) {
    Result<std::optional<Frame>> step = reader_.next(input);
    if (!step.ok()) {
      logBrokenFrame(step.error());
      invalidate();
      return Received::Ended;
    }
    if (!step.value().has_value()) break;
    handleFrame(std::move(*step.value()), reader);
    if (invalidated_) return Received::Ended;
  }
  return Received::More;
}

void Connection::logBrokenFrame(const Error& error) const {
  // The rule that was broken is always shown; the detail may quote the
  // peer's data (a map key), so it follows the usual redaction.
  std::optional<FrameFault> fault = frameFaultOf(error);
  mbxLog().error("%{public}s: closing: broken frame (%{public}s): %@", description(),
                 fault ? frameFaultName(*fault) : "unknown", error);
}

void Connection::handleFrame(Frame frame, PendingReply::Caller reader) {
  switch (frame.kind) {
    case FrameKind::Message:
    case FrameKind::Request: {
      if (cancelled_.load(std::memory_order_relaxed)) return;
      if (!handler_) {
        mbxLog().debug("%{public}s: no event handler; %{public}s %llu dropped", description(),
                       frameKindName(frame.kind), ull(frame.messageId));
        return;
      }
      handler_(ConnectionEvent(
          Message(std::move(frame.body), frame.kind, frame.messageId, 0, weak_from_this())));
      return;
    }
    case FrameKind::Reply: {
      std::optional<PendingReply> pending;
      {
        std::lock_guard<std::mutex> lock(pendingMu_);
        pending = pending_.take(frame.inReplyTo);
      }
      if (!pending) {
        mbxLog().debug("%{public}s: reply to unknown request %llu dropped", description(),
                       ull(frame.inReplyTo));
        return;
      }
      std::move(*pending).complete(Message(std::move(frame.body), FrameKind::Reply, frame.messageId,
                                           frame.inReplyTo, weak_from_this()),
                                   reader);
      return;
    }
    case FrameKind::Goodbye:
      if (!cancelled_.load(std::memory_order_relaxed) && handler_) {
        handler_(ConnectionEvent(ConnectionError::TerminationImminent));
      }
      return;
  }
}

void Connection::invalidate() {
  if (invalidated_) return;
  invalidated_ = true;
  // Declared first so that it is released last: it may hold the last
  // reference to this connection.
  std::shared_ptr<Connection> self;
  std::vector<PendingReply> pending;
  std::shared_ptr<internal::SocketHandle> socket;
  {
    std::lock_guard<std::mutex> lock(mu_);
    state_ = State::Invalid;
    closing_ = true;
    std::lock_guard<std::mutex> pendingLock(pendingMu_);
    pending = pending_.takeAll();
    output_.clear();
    socket = std::move(socket_);
  }
  source_->cancel();
  // The peer sees the end now, and a thread waiting in readUntilDone wakes,
  // even while references keep the descriptor open a little longer.
  ::shutdown(fd_, SHUT_RDWR);
  socket.reset();  // closes once the sources' cancel handlers let go too
  for (PendingReply& reply : pending) {
    std::move(reply).complete(makeError(ErrorCode::ConnectionInvalid, description()));
  }
  EventHandler handler = std::move(handler_);
  handler_ = nullptr;
  if (handler) handler(ConnectionEvent(ConnectionError::Invalid));
  std::shared_ptr<void> context;
  std::function<void(std::shared_ptr<void>)> finalizer;
  {
    std::lock_guard<std::mutex> lock(mu_);
    context = std::move(context_);
    finalizer = std::move(finalizer_);
    context_ = nullptr;
    finalizer_ = nullptr;
    self = std::move(selfWhileActive_);
  }
  handler = nullptr;
  if (finalizer) finalizer(std::move(context));
}

void Connection::setContext(std::shared_ptr<void> context,
                            std::function<void(std::shared_ptr<void>)> finalizer) {
  std::shared_ptr<void> oldContext;
  std::function<void(std::shared_ptr<void>)> oldFinalizer;
  {
    std::lock_guard<std::mutex> lock(mu_);
    oldContext = std::exchange(context_, std::move(context));
    oldFinalizer = std::exchange(finalizer_, std::move(finalizer));
  }
  if (oldFinalizer) oldFinalizer(std::move(oldContext));
}

std::shared_ptr<void> Connection::context() const {
  std::lock_guard<std::mutex> lock(mu_);
  return context_;
}

std::string Connection::description() const {
  std::string text = serviceName_;
  text += '#';
  text += std::to_string(serial_);
  if (peer_) {
    text += " (";
    text += peer_->description();
    text += ')';
  }
  return text;
}

std::size_t Connection::queuedOutputBytesForTesting() const {
  std::lock_guard<std::mutex> lock(mu_);
  return output_.bytes();
}

std::size_t Connection::pendingReplyCountForTesting() const {
  std::lock_guard<std::mutex> lock(pendingMu_);
  return pending_.size();
}

}  // namespace platform::mbx
