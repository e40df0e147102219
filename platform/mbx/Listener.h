// Listens under a service name (a Unix socket at
// <root>/run/quorvex/mbx/<name>, mode 0666) and hands each new connection to
// its event handler, on the target queue, suspended: the daemon sets the
// connection's event handler and context, then resumes it. The peer's
// identity is taken at accept; a peer that cannot be identified is still
// handed over, with peer() null, and the failure is logged.
//
//   auto listener = mbx::Listener::create("com.corvane.qvd", queue).value();
//   listener->setEventHandler([](const mbx::Listener::Event& event) { ... });
//   listener->resume();
//
// cancel() stops accepting, removes the socket file (if it is still ours)
// and delivers one last event: the ConnectionInvalid error. A resumed
// listener keeps itself alive until then.
//
// Thread safety: all members are safe to call from any thread, except where
// a REQUIRES says otherwise.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <variant>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/ConnectionLimits.h"
#include "platform/values/Error.h"
#include "platform/values/Result.h"

namespace platform::mbx {

class Listener : public std::enable_shared_from_this<Listener> {
 public:
  using Event = std::variant<std::shared_ptr<Connection>, platform::Error>;
  using EventHandler = std::function<void(const Event&)>;

  // Binds the service's socket; fails with BadServiceName, ServiceInUse (a
  // live listener holds the name) or SocketFailure. Accepted connections get
  // `limits`.
  static platform::Result<std::shared_ptr<Listener>> create(
      std::string_view serviceName, std::shared_ptr<dispatch::SerialQueue> target,
      ConnectionLimits limits = {});
  ~Listener();
  Listener(const Listener&) = delete;
  Listener& operator=(const Listener&) = delete;

  // REQUIRES: before resume().
  void setEventHandler(EventHandler handler);
  void resume();
  void cancel();

  const std::string& serviceName() const { return serviceName_; }
  const std::string& path() const { return path_; }

  // Connections accepted per turn on the target queue before others run.
  static constexpr int kMaxAcceptsPerTurn = 64;

 private:
  Listener(std::string_view serviceName, std::string path, int fd,
           std::shared_ptr<dispatch::SerialQueue> target, ConnectionLimits limits);
  void onAcceptable();    // on target_
  void pauseAccepting();  // out of descriptors: retry later instead of spinning
  void finish();          // on target_, once the source is cancelled

  const std::string serviceName_;
  const std::string path_;
  const int fd_;  // open until the source's cancel handler has run
  const std::shared_ptr<dispatch::SerialQueue> target_;
  const ConnectionLimits limits_;
  std::shared_ptr<dispatch::FdSource> source_;  // set by create(), then constant

  EventHandler handler_;  // set before resume(), used on target_
  std::atomic<bool> cancelled_{false};
  std::mutex mu_;
  bool resumed_ = false;                       // guarded by mu_
  std::shared_ptr<Listener> selfWhileActive_;  // guarded by mu_
};

}  // namespace platform::mbx
