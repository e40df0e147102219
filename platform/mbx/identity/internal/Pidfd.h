// Process file descriptors: handles on one process that never come to name
// another, whatever happens to its pid.
//
// Thread safety: free functions; safe from any thread.
#pragma once

#include <sys/types.h>

#include <string_view>

#include "platform/mbx/identity/internal/UniqueFd.h"
#include "platform/values/Result.h"

namespace platform::mbx::internal {

// A pidfd for whatever process holds `pid` now. ESRCH (POSIX domain) when
// none does.
Result<UniqueFd> openPidfd(pid_t pid);

// The pidfd the kernel recorded for the process that connected `socketFd`
// (SO_PEERPIDFD). An invalid UniqueFd when this kernel does not record one,
// so the caller must fall back to openPidfd and check what it got; ESRCH when
// the kernel says the peer is gone.
Result<UniqueFd> peerPidfd(int socketFd);

enum class Liveness { Alive, Exited };

// Whether the process is still running, without blocking: a pidfd becomes
// readable when its process exits (before it is reaped). A pidfd that cannot
// be polled counts as Exited, so doubt never vouches for a process.
Liveness livenessOf(int pidfd);

// The pid of the pidfd's process as this process's /proc numbers it (the
// "Pid:" line of /proc/self/fdinfo/<pidfd>): -1 once it has exited, 0 when it
// is outside the pid namespace of /proc. Comparing it with the pid of an open
// /proc/<pid> directory tells whether the two name one process.
Result<pid_t> pidOfPidfd(int pidfd);

// The parser behind pidOfPidfd: MalformedProcFile without exactly one "Pid:"
// line holding a number.
Result<pid_t> parsePidfdInfo(std::string_view text);

}  // namespace platform::mbx::internal
