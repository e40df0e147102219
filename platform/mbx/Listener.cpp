#include "platform/mbx/Listener.h"

#include <sys/socket.h>

#include <cerrno>
#include <chrono>

#include "platform/dispatch/TimerSource.h"
#include "platform/mbx/MbxError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/mbx/internal/MbxLog.h"
#include "platform/mbx/internal/ServiceSocket.h"
#include "platform/mbx/internal/SocketHandle.h"

namespace platform::mbx {

using internal::mbxLog;

namespace {

// How long accepting pauses when the process is out of descriptors: level-
// triggered readiness would otherwise spin on the pending connection.
constexpr std::chrono::milliseconds kAcceptBackoff{100};

}  // namespace

Listener::Listener(std::string_view serviceName, std::string path, int fd,
                   std::shared_ptr<dispatch::SerialQueue> target, ConnectionLimits limits)
    : serviceName_(serviceName),
      path_(std::move(path)),
      fd_(fd),
      target_(std::move(target)),
      limits_(limits) {}

Result<std::shared_ptr<Listener>> Listener::create(std::string_view serviceName,
                                                   std::shared_ptr<dispatch::SerialQueue> target,
                                                   ConnectionLimits limits) {
  Result<std::string> path = internal::servicePath(serviceName);
  if (!path.ok()) return path.error();
  Result<internal::BoundSocket> bound = internal::listenAt(path.value());
  if (!bound.ok()) return bound.error();
  const internal::BoundSocket socketFile = bound.value();
  auto socket = std::make_shared<internal::SocketHandle>(socketFile.fd);

  std::shared_ptr<Listener> listener(
      new Listener(serviceName, path.value(), socketFile.fd, target, limits));
  std::weak_ptr<Listener> weak = listener;
  auto source = dispatch::FdSource::create(
      "com.corvane.mbx.listener." + std::string(serviceName), dispatch::Priority::Default,
      socketFile.fd, dispatch::FdSource::Event::Readable, std::move(target), [weak] {
        if (auto self = weak.lock()) self->onAcceptable();
      });
  if (!source) {
    internal::removeSocketFile(path.value(), socketFile.device, socketFile.inode);
    return makeError(ErrorCode::SocketFailure, source.message());
  }
  // Runs once the reactor no longer watches the socket: the file goes and the
  // last event is delivered; the descriptor closes as the handler is released.
  source.value()->setCancelHandler([weak, socket, file = path.value(), socketFile] {
    internal::removeSocketFile(file, socketFile.device, socketFile.inode);
    if (auto self = weak.lock()) self->finish();
  });
  listener->source_ = std::move(source).value();
  return listener;
}

Listener::~Listener() {
  if (source_) source_->cancel();
}

void Listener::setEventHandler(EventHandler handler) {
  std::lock_guard<std::mutex> lock(mu_);
  if (resumed_ || cancelled_.load()) {
    mbxLog().fault("listener %{public}s: event handler set after resume() or cancel(); ignored",
                   serviceName_);
    return;
  }
  handler_ = std::move(handler);
}

void Listener::resume() {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (resumed_ || cancelled_.load()) return;
    resumed_ = true;
    selfWhileActive_ = shared_from_this();
  }
  source_->resume();
}

void Listener::cancel() {
  if (cancelled_.exchange(true)) return;
  source_->cancel();
}

void Listener::onAcceptable() {
  for (int accepted = 0; accepted < kMaxAcceptsPerTurn; ++accepted) {
    if (cancelled_.load(std::memory_order_relaxed)) return;
    int fd = ::accept4(fd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) {
      const int err = errno;
      if (err == EINTR || err == ECONNABORTED) continue;
      if (err == EAGAIN || err == EWOULDBLOCK) return;
      mbxLog().error("listener %{public}s: accept failed: %{errno}d", serviceName_, err);
      if (err == EMFILE || err == ENFILE || err == ENOBUFS || err == ENOMEM) pauseAccepting();
      return;
    }
    std::shared_ptr<const PeerIdentity> peer;
    Result<std::shared_ptr<const PeerIdentity>> identity = PeerIdentity::fromSocket(fd);
    if (identity.ok()) {
      peer = std::move(identity).value();
    } else {
      // The daemon decides what an unidentified peer may do.
      mbxLog().error("listener %{public}s: the peer's identity could not be taken: %@",
                     serviceName_, identity.error());
    }
    Result<std::shared_ptr<Connection>> connection =
        Connection::adopt(serviceName_, fd, std::move(peer), limits_);
    if (!connection.ok()) {
      mbxLog().error("listener %{public}s: connection dropped: %@", serviceName_,
                     connection.error());
      continue;
    }
    if (handler_) {
      handler_(Event(std::move(connection).value()));
    } else {
      mbxLog().debug("listener %{public}s: no event handler; connection dropped", serviceName_);
    }
  }
}

void Listener::pauseAccepting() {
  source_->suspend();
  dispatch::after(kAcceptBackoff, target_, [weak = weak_from_this()] {
    auto self = weak.lock();
    if (self && !self->cancelled_.load()) self->source_->resume();
  });
}

void Listener::finish() {
  std::shared_ptr<Listener> self;
  {
    std::lock_guard<std::mutex> lock(mu_);
    self = std::move(selfWhileActive_);
  }
  EventHandler handler = std::move(handler_);
  handler_ = nullptr;
  if (handler) {
    handler(Event(makeError(ErrorCode::ConnectionInvalid, "listener " + serviceName_ + " cancelled")));
  }
}

}  // namespace platform::mbx
