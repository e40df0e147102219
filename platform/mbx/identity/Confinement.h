// The facts that tell a sandboxed process from a free one, and the rule that
// compares a peer's facts with the daemon's own.
//
// Thread safety: a plain value.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

namespace platform::mbx {

// The label AppArmor gives a process with no profile.
inline constexpr std::string_view kUnconfinedLabel = "unconfined";

struct Confinement {
  int seccompMode = 0;      // 0 none, 1 strict, 2 filter
  bool noNewPrivs = false;  // PR_SET_NO_NEW_PRIVS
  // The LSM label ("unconfined", "profile (enforce)", ...), or empty when no
  // LSM labels processes.
  std::string securityLabel;
  std::uint64_t mountNamespace = 0;  // inode of ns/mnt

  // Whether this process is held in more than `daemon` is: only differences
  // from the daemon count, so a daemon that itself runs under a seccomp
  // filter or a profile does not see every client as sandboxed. Sandboxed
  // when any of:
  //   - a seccomp filter (mode 2) where the daemon has none;
  //   - NoNewPrivs where the daemon lacks it;
  //   - a label that is neither empty, "unconfined", nor the daemon's own;
  //   - another mount namespace than the daemon's.
  bool isSandboxedRelativeTo(const Confinement& daemon) const;

  // "seccomp filter, no-new-privs": the reasons the rule above found, for
  // logs; empty when there are none.
  std::string sandboxReasonsRelativeTo(const Confinement& daemon) const;
};

}  // namespace platform::mbx
