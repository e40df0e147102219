// The outgoing half of Connection: message ids, direct writes, the output
// queue and its limit, and synchronous waits.
#include <poll.h>
#include <sys/socket.h>

#include <cerrno>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/MbxError.h"
#include "platform/mbx/internal/MbxLog.h"
#include "platform/mbx/internal/ReadParking.h"

namespace platform::mbx {

using internal::mbxLog;
using internal::PendingReply;

namespace {

unsigned long long ull(std::uint64_t value) {
  return static_cast<unsigned long long>(value);
}

}  // namespace

void Connection::send(Value body) {
  Result<std::vector<std::uint8_t>> frame = encodeFrame(FrameKind::Message, 0, body);
  if (!frame.ok()) {
    mbxLog().error("%{public}s: message not sent: %@", description(), frame.error());
    return;
  }
  if (Status sent = transmit(std::move(frame).value(), nullptr); !sent.ok()) {
    mbxLog().debug("%{public}s: message not sent: %@", description(), sent.error());
  }
}

void Connection::sendWithReply(Value body, std::shared_ptr<dispatch::Queue> replyQueue,
                               ReplyHandler handler) {
  PendingReply pending{replyQueue ? std::move(replyQueue) : queue_, std::move(handler)};
  Result<std::vector<std::uint8_t>> frame = encodeFrame(FrameKind::Request, 0, body);
  if (!frame.ok()) {
    std::move(pending).complete(frame.error());
    return;
  }
  // transmit() takes the handler only when the request went out.
  if (Status sent = transmit(std::move(frame).value(), &pending); !sent.ok()) {
    std::move(pending).complete(sent.error());
    return;
  }
  // The reply is read by the pool, so reads must be watched.
  unparkReads();
}

void Connection::unparkReads() {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (!readsParked_ || syncReader_) return;
    // Taking the reader role keeps a synchronous waiter from suspending
    // before this resume has happened.
    readsParked_ = false;
    syncReader_ = true;
  }
  source_->resume(dispatch::FdSource::Event::Readable);
  std::lock_guard<std::mutex> lock(mu_);
  syncReader_ = false;
}

bool Connection::unparkReadsIfIdle(std::chrono::steady_clock::time_point now,
                                   std::chrono::steady_clock::duration grace) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (readsParked_ && !syncReader_ && now - parkedAt_ < grace) return false;
    if (syncReader_) {
      // A synchronous request is running: it parks again (and is listed
      // again) when it ends only if it is not listed, so stay listed.
      return false;
    }
    parkListed_ = false;
    if (!readsParked_) return true;
  }
  unparkReads();
  return true;
}

Result<Message> Connection::sendWithReplySync(Value body) {
  if (queue_->isCurrent()) {
    return makeError(ErrorCode::WouldDeadlock,
                     "a synchronous request on " + description() + " from its own delivery queue");
  }
  auto waiter = std::make_shared<SyncWaiter>();
  // No queue: whoever reads the reply completes the wait directly.
  PendingReply pending{nullptr, [waiter](Result<Message> outcome) {
                         waiter->outcome.emplace(std::move(outcome));
                         waiter->done.store(true, std::memory_order_release);
                         waiter->signal.signal();
                       }};
  Result<std::vector<std::uint8_t>> frame = encodeFrame(FrameKind::Request, 0, body);
  if (!frame.ok()) return frame.error();
  std::shared_ptr<internal::SocketHandle> socket;
  bool wasParked = false;
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (state_ == State::Suspended) return makeError(ErrorCode::NotResumed, description());
    if (state_ == State::Active && !closing_ && !syncReader_) {
      syncReader_ = true;
      socket = socket_;
      wasParked = readsParked_;
      readsParked_ = false;
    }
  }
  if (socket) {
    // The waiting thread reads the reply itself: the source stops watching
    // reads meanwhile, so no pool thread wakes for the reply only to hand
    // it over. A previous request may have left the watching off already.
    if (!wasParked) source_->suspend(dispatch::FdSource::Event::Readable);
    Status sent = transmit(std::move(frame).value(), &pending);
    if (sent.ok()) readUntilDone(*waiter, socket->fd());
    // Watching stays off for the next synchronous request unless someone
    // else awaits a reply (a pool thread must read it); the parking sweep
    // switches it on once the connection has been idle for a moment.
    // Either way the role is given up only after: the next waiter's
    // suspend() must come after a resume, or the reactor could take its
    // reply while it waits.
    bool list = false;
    bool resume = false;
    {
      // Decided together with giving up the role: an asynchronous request
      // made after this sees the parked state and unparks.
      std::lock_guard<std::mutex> lock(mu_);
      std::lock_guard<std::mutex> pendingLock(pendingMu_);
      if (pending_.size() == 0 && state_ == State::Active && !closing_) {
        readsParked_ = true;
        parkedAt_ = std::chrono::steady_clock::now();
        list = !parkListed_;
        parkListed_ = true;
        syncReader_ = false;
      } else {
        resume = true;
      }
    }
    if (resume) {
      source_->resume(dispatch::FdSource::Event::Readable);
      std::lock_guard<std::mutex> lock(mu_);
      syncReader_ = false;
    }
    if (list) internal::ReadParking::instance().park(weak_from_this());
    if (!sent.ok()) return sent.error();
  } else if (Status sent = transmit(std::move(frame).value(), &pending); !sent.ok()) {
    return sent.error();
  }
  waiter->signal.wait();
  return std::move(*waiter->outcome);
}

void Connection::readUntilDone(const SyncWaiter& waiter, int fd) {
  // Waits out a delivery that was already running when the reactor was told
  // to stop: it may have taken the reply, or be about to.
  queue_->sync([] {});
  std::uint8_t chunk[ConnectionLimits::kReadChunkBytes];
  for (;;) {
    if (waiter.done.load(std::memory_order_acquire)) return;
    ssize_t n;
    int err = 0;
    {
      // The socket is in blocking mode (every other call passes
      // MSG_DONTWAIT), so the wait and the read are one system call.
      // invalidate() shuts the socket down, which ends this wait too.
      dispatch::ScopedBlockingCall blocking;
      do {
        n = ::recv(fd, chunk, sizeof chunk, 0);
        err = n < 0 ? errno : 0;
      } while (err == EINTR);
    }
    if (err == EAGAIN || err == EWOULDBLOCK) {
      // Only a socket left non-blocking gets here: wait for input instead.
      dispatch::ScopedBlockingCall blocking;
      pollfd ready{fd, POLLIN, 0};
      while (::poll(&ready, 1, -1) < 0 && errno == EINTR) {
      }
      continue;
    }
    // On the delivery queue (inline when it is idle), so that every event
    // keeps its place in the connection's order.
    queue_->sync([this, n, err, &chunk] {
      (void)consumeReceived(n, err, chunk, PendingReply::Caller::Anyone);
    });
  }
}

void Connection::sendGoodbye() {
  Result<std::vector<std::uint8_t>> frame = encodeFrame(FrameKind::Goodbye, 0, Value());
  if (frame.ok()) (void)transmit(std::move(frame).value(), nullptr);
}

Status Connection::sendReply(std::uint64_t requestId, Value body,
                             std::span<const cbor::EncodedEntry> encoded) {
  Result<std::vector<std::uint8_t>> frame = encodeFrame(FrameKind::Reply, requestId, body, encoded);
  if (!frame.ok()) {
    mbxLog().error("%{public}s: reply to request %llu not sent: %@", description(), ull(requestId),
                   frame.error());
    return frame.error();
  }
  if (Status sent = transmit(std::move(frame).value(), nullptr); !sent.ok()) {
    mbxLog().debug("%{public}s: reply to request %llu dropped: %@", description(), ull(requestId),
                   sent.error());
  }
  return okStatus();
}

Status Connection::transmit(std::vector<std::uint8_t> frame, PendingReply* pending) {
  std::lock_guard<std::mutex> lock(mu_);
  if (state_ == State::Invalid || closing_) return makeError(ErrorCode::ConnectionInvalid);
  // Ids are stamped under the lock that orders the writes, so they increase
  // on the wire whichever threads send.
  if (pending != nullptr) {
    std::lock_guard<std::mutex> pendingLock(pendingMu_);
    if (pending_.size() >= limits_.maxPendingReplies) {
      return makeError(ErrorCode::TooManyPendingReplies,
                       std::to_string(pending_.size()) + " awaited on " + description());
    }
    const std::uint64_t id = ++lastSentId_;
    setMessageId(frame, id);
    pending_.add(id, std::move(*pending));
  } else {
    setMessageId(frame, ++lastSentId_);
  }
  std::size_t written = 0;
  if (output_.empty()) {
    // Nothing queued ahead: write now, on the caller's thread.
    for (;;) {
      ssize_t n = ::send(fd_, frame.data(), frame.size(), MSG_NOSIGNAL | MSG_DONTWAIT);
      if (n >= 0) {
        written = static_cast<std::size_t>(n);
        break;
      }
      const int err = errno;
      if (err == EINTR) continue;
      if (err == EAGAIN || err == EWOULDBLOCK) break;
      mbxLog().info("%{public}s: closing: write failed: %{errno}d", description(), err);
      closeLaterLocked();
      return okStatus();  // a request learns of it as the connection's error
    }
    if (written == frame.size()) return okStatus();
  }
  output_.append(std::move(frame), written);
  if (output_.bytes() > limits_.maxQueuedOutputBytes) {
    mbxLog().error("%{public}s: closing: the peer does not read; %zu bytes queued, limit %zu",
                   description(), output_.bytes(), limits_.maxQueuedOutputBytes);
    closeLaterLocked();
    return okStatus();
  }
  if (!writeWatched_) {
    // The socket's own source takes on writability until the queue drains.
    writeWatched_ = true;
    source_->resume(dispatch::FdSource::Event::Writable);
  }
  return okStatus();
}

void Connection::closeLaterLocked() {
  if (closing_) return;
  closing_ = true;
  output_.clear();
  queue_->async([self = shared_from_this()] { self->invalidate(); });
}

dispatch::FdSource::Readiness Connection::onWritable() {
  using Readiness = dispatch::FdSource::Readiness;
  std::lock_guard<std::mutex> lock(mu_);
  if (state_ == State::Invalid || closing_) return Readiness::Drained;
  int err = 0;
  switch (output_.flushTo(fd_, &err)) {
    case internal::OutputQueue::Flush::Drained:
      writeWatched_ = false;
      source_->suspend(dispatch::FdSource::Event::Writable);
      return Readiness::Drained;
    case internal::OutputQueue::Flush::WouldBlock:
      // Written until EAGAIN: room freed by the peer is a new report.
      return Readiness::Drained;
    case internal::OutputQueue::Flush::Failed:
      mbxLog().info("%{public}s: closing: write failed: %{errno}d", description(), err);
      closeLaterLocked();
      return Readiness::Drained;
  }
  return Readiness::Drained;
}

}  // namespace platform::mbx
