// The taking of one identity: the reads, and the checks that bind them all to
// one process that is still running when they are done.
//
// Thread safety: static functions; each call works alone, on its own thread.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <optional>
#include <string>

#include "platform/mbx/identity/IdentityTestHooks.h"
#include "platform/mbx/identity/internal/UniqueFd.h"
#include "platform/values/Result.h"

namespace platform::mbx {

class PeerIdentity;

namespace internal {

class IdentityTaker {
 public:
  using Taken = Result<std::shared_ptr<const PeerIdentity>>;

  // REQUIRES: connectedFd is a connected AF_UNIX socket.
  static Taken fromSocket(int connectedFd, const IdentityTestHooks& hooks);
  static Taken ofSelf();

 private:
  struct Subject {
    pid_t pid = 0;
    uid_t uid = 0;
    gid_t gid = 0;
    // The clock (see ClockTicks.h) before anything was read: a process that
    // started later cannot be the one that connected.
    std::uint64_t notAfter = 0;
    // Invalid when it must be opened from the pid.
    UniqueFd pidfd;
    // From the socket; none when it must be read from /proc.
    std::optional<std::string> securityLabel;
  };

  static Taken take(Subject subject, const IdentityTestHooks& hooks);
};

}  // namespace internal
}  // namespace platform::mbx
