// One client connection: who the peer is (pid, executable path, bundle,
// entitlements, sandboxing), and the turning of each request message into a
// Transaction submitted to the server's service queue. It lives as long as
// its connection (the connection holds it as its context) and as long as a
// Transaction still refers to it.
//
// Thread safety: the identity accessors are safe from any queue. Events run
// on the connection's delivery queue; requestCount changes only on the
// service queue; acceptWork is an atomic flag read on the service queue.
#pragma once

#include <atomic>
#include <cstdint>
#include <functional>
#include <memory>
#include <string>
#include <string_view>

#include "Quorvex/QVBundle.h"
#include "platform/mbx/Connection.h"
#include "platform/values/Value.h"

namespace qvd {

class QVDServer;
enum class Submission;

class QVDMbxClient : public std::enable_shared_from_this<QVDMbxClient> {
 public:
  // Identifies the peer, stores the client as the connection's context,
  // installs the event handler and resumes the connection. None (with the
  // reason logged) when the peer's executable path is unknown; the caller
  // then cancels the connection.
  // REQUIRES: on the listener queue; connection and server not null.
  static std::shared_ptr<QVDMbxClient> initWithConnection(
      const std::shared_ptr<platform::mbx::Connection>& connection,
      std::shared_ptr<QVDServer> server);

  ~QVDMbxClient();

  // The peer's process id, from the connection while it exists.
  int pid() const;
  const std::string& path() const { return path_; }
  const std::shared_ptr<QVBundle>& bundle() const { return bundle_; }
  const std::shared_ptr<QVDServer>& server() const { return server_; }
  // Empty once the connection has gone.
  std::shared_ptr<platform::mbx::Connection> connection() const { return connection_.lock(); }

  // The entitlement `key` of the peer's executable, or none (also when the
  // grants cannot be read, which is logged).
  platform::Value entitlementValueForKey(std::string_view key) const;
  // True when the entitlement is present and neither false nor 0.
  bool hasEntitlement(std::string_view key) const;
  // Every entitlement of the peer's executable as the grants stand now
  // (empty when they cannot be read, which is logged). A request that asks
  // about many plug-ins reads them once: each lookup re-reads the grants.
  platform::Dictionary entitlements() const;
  // True when the peer runs confined beyond the daemon.
  bool isSandboxed() const;

  bool acceptWork() const { return acceptWork_.load(); }
  // REQUIRES: on the service queue.
  std::uint32_t requestCount() const;

  // "<QVDMbxClient 0x.. con=.. pid=.. path=..>", or "<QVDMbxClient 0x.. NO
  // CONNECTION>" once the connection has gone.
  std::string description() const;

  // The connection's events; public so that tests can drive a client.
  void dying();
  void dead();

 private:
  QVDMbxClient(const std::shared_ptr<platform::mbx::Connection>& connection,
               std::shared_ptr<QVDServer> server);
  void handleEvent(const platform::mbx::ConnectionEvent& event);
  void handleRequest(const platform::mbx::Message& message);
  void countAndDispatch(const std::function<void()>& dispatch);
  void submit(std::function<void()> work, Submission submission);
  void finishDeath();

  std::atomic<bool> acceptWork_{true};
  const std::weak_ptr<platform::mbx::Connection> connection_;
  const std::shared_ptr<QVDServer> server_;
  std::string path_;
  std::shared_ptr<QVBundle> bundle_;
  // The peer as identified at accept: the daemon's handle on its code
  // signature and sandboxing. Owned; released with the client.
  std::shared_ptr<const platform::mbx::PeerIdentity> task_;
  std::uint32_t requestCount_ = 0;  // only on the service queue

  // A synchronous request holds the connection's later events back until it
  // has been dispatched. Only the death can tell the difference, so instead
  // of holding a pool thread the death waits behind the outstanding
  // synchronous items.
  std::atomic<int> syncOutstanding_{0};
  std::atomic<bool> deathPending_{false};
};

// Whether an entitlement value grants it: present and neither false nor 0.
bool entitlementGranted(const platform::Value& value);

}  // namespace qvd
