// What the kernel recorded about the process at the other end of a connected
// Unix socket when it connected.
//
// Thread safety: free functions; safe from any thread.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <string>

#include "platform/values/Result.h"

namespace platform::mbx::internal {

// Labels are short; a longer one is refused rather than cut.
inline constexpr std::size_t kSecurityLabelLimit = 4 * 1024;

struct PeerCredentials {
  pid_t pid = 0;  // 0 when the peer is in a pid namespace this one cannot see
  uid_t uid = 0;  // effective ids at connect time
  gid_t gid = 0;
};

// SO_PEERCRED.
Result<PeerCredentials> peerCredentials(int socketFd);

// SO_PEERSEC: the peer's LSM label at connect time, or empty when no LSM
// labels sockets. TooLong past kSecurityLabelLimit.
Result<std::string> peerSecurityLabel(int socketFd);

}  // namespace platform::mbx::internal
