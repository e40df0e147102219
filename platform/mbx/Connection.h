// One end of a long-lived Unix-socket connection carrying frames both ways
// (see Frame.h). Incoming messages and the connection's own events reach the
// event handler in order, one at a time, on the connection's delivery queue;
// a connection costs no thread (its socket is watched by the shared reactor).
//
//   auto conn = mbx::Connection::connectToService("com.corvane.qvd").value();
//   conn->setEventHandler([](const mbx::ConnectionEvent& event) { ... });
//   conn->resume();
//   auto reply = conn->sendWithReplySync(platform::Dictionary{{"op", "ping"}});
//
// Life cycle: a connection starts suspended. resume() starts delivery and
// keeps the connection alive on its own until it becomes invalid: the peer
// closed, cancel() was called, or the peer broke a framing rule or stopped
// reading (both logged). Then ConnectionError::Invalid is delivered once,
// every request still awaiting a reply gets the ConnectionInvalid error, the
// context finalizer runs and the event handler is released; nothing follows.
// A goodbye frame from the peer is delivered as TerminationImminent.
//
// Thread safety: all members are safe to call from any thread, except where
// a REQUIRES says otherwise.
#pragma once

#include <sys/types.h>

#include <atomic>
#include <chrono>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <span>
#include <string>
#include <string_view>
#include <variant>

#include "platform/cbor/EncodedValue.h"
#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/ConnectionLimits.h"
#include "platform/mbx/FrameReader.h"
#include "platform/mbx/Message.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/mbx/internal/OutputQueue.h"
#include "platform/mbx/internal/PendingReplies.h"
#include "platform/mbx/internal/SocketHandle.h"
#include "platform/values/Result.h"

namespace platform::mbx {

enum class ConnectionError { Invalid, TerminationImminent };
const char* connectionErrorName(ConnectionError error);

using ConnectionEvent = std::variant<Message, ConnectionError>;

class Listener;
namespace internal {
class ReadParking;
}

class Connection : public std::enable_shared_from_this<Connection> {
 public:
  using EventHandler = std::function<void(const ConnectionEvent&)>;
  using ReplyHandler = std::function<void(platform::Result<Message>)>;

  // Client side: connects to a named service under the platform root. The
  // connection comes suspended; peer() is null on this side.
  static platform::Result<std::shared_ptr<Connection>> connectToService(
      std::string_view serviceName, ConnectionLimits limits = {});

  ~Connection();
  Connection(const Connection&) = delete;
  Connection& operator=(const Connection&) = delete;

  // REQUIRES: before resume().
  void setEventHandler(EventHandler handler);
  // Starts delivery; no effect after the first call or once invalid.
  void resume();
  // Ends the connection: Invalid is delivered once, then nothing. Idempotent.
  void cancel();

  // Sends a message that expects no reply. A body that cannot be sent (see
  // encodeFrame) or a connection that is invalid is logged, not reported.
  void send(platform::Value body);
  // Sends a request; `handler` runs on `replyQueue` (the delivery queue when
  // null) with the reply, or with the error that prevented one: the
  // connection's ConnectionInvalid when it ends first, TooManyPendingReplies,
  // UnencodableBody or BodyTooLarge.
  void sendWithReply(platform::Value body, std::shared_ptr<dispatch::Queue> replyQueue,
                     ReplyHandler handler);
  // Sends a request and waits (marked as blocking) for its reply or error.
  // While it waits, the calling thread reads the socket itself, with the
  // delivery queue current, so events that arrive first are delivered first
  // (one thread at a time does this; others wait for the reactor). Fails at
  // once with WouldDeadlock on the delivery queue, and with NotResumed before
  // resume() (no reply could ever be read).
  platform::Result<Message> sendWithReplySync(platform::Value body);
  // Tells the peer this process is about to exit.
  void sendGoodbye();

  // The identity taken when the listener accepted the connection; null on the
  // client side and when it could not be taken (that failure is logged).
  const PeerIdentity* peer() const { return peer_.get(); }
  std::shared_ptr<const PeerIdentity> peerIdentity() const { return peer_; }

  // An object that lives as long as the connection: released, through
  // `finalizer` when one is given, once Invalid has been delivered (or when
  // a never-resumed connection is destroyed). Setting a new context
  // finalizes the old one at once.
  void setContext(std::shared_ptr<void> context,
                  std::function<void(std::shared_ptr<void>)> finalizer = nullptr);
  std::shared_ptr<void> context() const;

  std::shared_ptr<dispatch::SerialQueue> deliveryQueue() const { return queue_; }
  // "com.corvane.qvd#12 (pid 812 (uid 0) /usr/bin/x)".
  std::string description() const;

  // Bytes waiting to be written and requests waiting for replies.
  std::size_t queuedOutputBytesForTesting() const;
  std::size_t pendingReplyCountForTesting() const;

 private:
  friend class Listener;
  friend class Reply;
  enum class State { Suspended, Active, Invalid };

  Connection(std::string_view serviceName, std::shared_ptr<internal::SocketHandle> socket,
             std::shared_ptr<const PeerIdentity> peer, ConnectionLimits limits);
  // Wraps a connected socket (taking `fd`) in a suspended connection. Every read and
  // write passes MSG_DONTWAIT; only a synchronous waiter blocks, in recv().
  static platform::Result<std::shared_ptr<Connection>> adopt(
      std::string_view serviceName, int fd, std::shared_ptr<const PeerIdentity> peer,
      const ConnectionLimits& limits);

  // Fails only when `body` cannot be framed; a reply that cannot be
  // delivered (the peer has gone) is dropped and logged.
  // `encoded` entries join the body's map as they are.
  platform::Status sendReply(std::uint64_t requestId, platform::Value body,
                             std::span<const platform::cbor::EncodedEntry> encoded = {});
  // Stamps the next message id on `frame` and writes or queues it; registers
  // `pending` under that id when given. Fails only when nothing was sent.
  platform::Status transmit(std::vector<std::uint8_t> frame, internal::PendingReply* pending);
  // A synchronous request's wait: completed by whoever reads the reply.
  struct SyncWaiter {
    std::atomic<bool> done{false};
    dispatch::Semaphore signal;
    std::optional<platform::Result<Message>> outcome;
  };
  // Reads and delivers input on the calling thread until `waiter` is done.
  // REQUIRES: this thread holds the reader role (syncReader_).
  void readUntilDone(const SyncWaiter& waiter, int fd);
  // Switches read watching back on if a synchronous request left it off,
  // unless a synchronous waiter is reading now (it decides when it ends).
  void unparkReads();
  // For the parking sweep: true when the connection needs no more sweeps
  // (reads unparked now, or not parked any more); false while it has been
  // parked for less than `grace`.
  bool unparkReadsIfIdle(std::chrono::steady_clock::time_point now,
                         std::chrono::steady_clock::duration grace);
  friend class internal::ReadParking;
  // REQUIRES: mu_ held. Asks the delivery queue to end the connection.
  void closeLaterLocked();

  // Delivery-queue work. The handlers say whether they went on until EAGAIN.
  dispatch::FdSource::Readiness onReadable();
  dispatch::FdSource::Readiness onWritable();
  // Takes the outcome of one recv() (`n` bytes, or -1 with `err`): delivers
  // the frames it completes, or ends the connection at EOF, on an error or on
  // a broken frame.
  enum class Received { More, Ended };
  // `reader` says who read the bytes: the event handler, which returns to
  // the pool right after, or a synchronous waiter, which goes on waiting.
  Received consumeReceived(ssize_t n, int err, const std::uint8_t* bytes,
                           internal::PendingReply::Caller reader);
  void handleFrame(Frame frame, internal::PendingReply::Caller reader);
  void logBrokenFrame(const platform::Error& error) const;
  void invalidate();

  const std::string serviceName_;
  const std::uint64_t serial_;  // numbers connections in descriptions
  const ConnectionLimits limits_;
  const std::shared_ptr<const PeerIdentity> peer_;
  const std::shared_ptr<dispatch::SerialQueue> queue_;
  const int fd_;  // usable while the connection is valid
  // The socket's one source, set by adopt(), then constant. It watches reads
  // while the connection is active and writes while output is queued.
  std::shared_ptr<dispatch::FdSource> source_;

  // Only touched on the delivery queue (the handler also before resume()).
  FrameReader reader_;
  EventHandler handler_;
  bool invalidated_ = false;

  std::atomic<bool> cancelled_{false};

  mutable std::mutex mu_;
  State state_ = State::Suspended;                  // guarded by mu_
  bool closing_ = false;                            // guarded by mu_: no more output
  std::shared_ptr<internal::SocketHandle> socket_;  // guarded by mu_
  std::uint64_t lastSentId_ = 0;                    // guarded by mu_
  internal::OutputQueue output_;                    // guarded by mu_
  bool writeWatched_ = false;                       // guarded by mu_: output is queued
  // Its own lock, taken inside mu_ where both are held: the reader looks a
  // reply up while a sender may hold mu_ across its write, and must not
  // wait for that write to finish.
  mutable std::mutex pendingMu_;
  internal::PendingReplies pending_;  // guarded by pendingMu_
  bool syncReader_ = false;           // guarded by mu_: a sync waiter reads
  // Read watching left off after a synchronous request (see ReadParking).
  bool readsParked_ = false;                              // guarded by mu_
  bool parkListed_ = false;                               // guarded by mu_
  std::chrono::steady_clock::time_point parkedAt_;        // guarded by mu_
  std::shared_ptr<Connection> selfWhileActive_;           // guarded by mu_
  std::shared_ptr<void> context_;                         // guarded by mu_
  std::function<void(std::shared_ptr<void>)> finalizer_;  // guarded by mu_
};

}  // namespace platform::mbx
