// The daemon one fuzzing process talks to: an in-process server (the unit
// tests' TestServer) over fake platform services, with a fixed catalogue of
// plug-ins on disk and in the fake registry, and one client connected to it
// over a real socket. Made once per process; every input goes through the
// same connection, and what an input may leave behind (holds, removed
// registrations) is put back afterwards, so memory and state stay bounded.
//
// Thread safety: call from the fuzzing thread only.
#pragma once

#include <atomic>
#include <chrono>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/dispatch/Semaphore.h"
#include "platform/holvane/RegistrationRecord.h"
#include "platform/mbx/Message.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace qvd::testing {
class TestServer;
class TestClient;
}  // namespace qvd::testing

namespace qvd {
class QVDMbxClient;
}

namespace qvd::fuzzing {

// Who the client is for one input, from one byte of it (bit 0 first).
struct ClientSettings {
  bool manager = false;             // holds the manager entitlement
  bool environment = false;         // may hand plug-ins an environment
  bool restricted = false;          // may only use com.example.alpha and beta
  bool flag = false;                // holds the entitlement beta demands
  bool sandboxed = false;           // runs confined
  bool unreadable = false;          // its entitlements cannot be read
  bool badRestriction = false;      // its restriction is not a rule set
  static ClientSettings fromByte(std::uint8_t byte);
};

// The fixed plug-in catalogue (FuzzPlugIns.cpp): bundles written under the
// platform root and their registration records.
std::vector<platform::holvane::PlugInRecord> makePlugInCatalogue();

// A request on its way. Shared with the reply handler, which may outlive
// the waiter.
class PendingReply {
 public:
  // True once the reply (or the connection's error) has come.
  bool waitFor(std::chrono::milliseconds limit);
  // REQUIRES: waitFor() returned true.
  const platform::Result<platform::mbx::Message>& reply() const { return *reply_; }

 private:
  friend class FuzzDaemon;
  platform::dispatch::Semaphore arrived_{0};
  std::atomic<bool> done_{false};
  std::optional<platform::Result<platform::mbx::Message>> reply_;
};

class FuzzDaemon {
 public:
  // The process's daemon, made on first use; aborts when it cannot be made.
  static FuzzDaemon& instance();

  void apply(const ClientSettings& settings);
  std::shared_ptr<PendingReply> send(platform::Value request);
  // Requests awaiting replies and output queued, on both ends of the
  // connection: for the report of a request that got no reply.
  std::string connectionState() const;
  // Waits until the service queue has run everything queued so far.
  void drainServiceQueue();
  // Releases the client's holds and registers again any plug-in of the
  // catalogue that a request removed.
  void restore();
  // Top-level strings and strings in top-level arrays with every "$ROOT"
  // replaced by the platform root, so that seeds can name files in a root
  // that differs per process.
  platform::Value withRoot(const platform::Value& request) const;

 private:
  FuzzDaemon();

  testing::TestServer* server_ = nullptr;  // never destroyed: pool threads outlive main
  testing::TestClient* client_ = nullptr;
  std::shared_ptr<QVDMbxClient> peer_;     // the server's side of the client
  std::vector<platform::holvane::PlugInRecord> catalogue_;
  std::string self_;
};

}  // namespace qvd::fuzzing
