// Who is at the other end of a Unix stream connection: the process, its
// credentials, the program it runs and how confined it is. The daemon takes
// it once, when it accepts the connection, and decides from it what the
// client may do: entitlements are granted to executable paths, and the
// confinement facts say whether the client counts as sandboxed.
//
// Once taken, an identity never changes: a peer that later runs another
// program, or exits and leaves its pid to another process, does not change
// what it says. Taking it fails instead of naming the wrong process:
// every /proc read goes through one directory fd, and the process is pinned
// by a pidfd that is checked, with the start time, after the reads.
//
//   Result<std::shared_ptr<const PeerIdentity>> peer = PeerIdentity::fromSocket(fd);
//   if (!peer) { cancel the connection: peer.error() says why }
//
// Needs Linux 5.5 (pidfd_open, and a pidfd's pid in its fdinfo). From 6.5
// the kernel hands out the peer's pidfd itself (SO_PEERPIDFD), which closes
// the window, left open on older kernels, in which a peer exits and its pid
// is reused before the accept.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <memory>
#include <string>

#include "platform/mbx/identity/Confinement.h"
#include "platform/mbx/identity/IdentityTestHooks.h"
#include "platform/values/Result.h"

namespace platform::mbx {

namespace internal {
class IdentityTaker;
}

// Thread safety: immutable after creation; any thread may use a shared one.
class PeerIdentity {
 public:
  // The identity of the process that connected `connectedFd`. Fails with
  // PeerExited when that process is no longer running (a peer that exited
  // never yields an identity of some other process), with another
  // IdentityErrorCode when the facts do not hold together, or with a POSIX
  // error naming the call that failed.
  // REQUIRES: connectedFd is a connected AF_UNIX socket.
  static Result<std::shared_ptr<const PeerIdentity>> fromSocket(int connectedFd);

  // The daemon's own identity, to compare peers with.
  static Result<std::shared_ptr<const PeerIdentity>> ofSelf();

  // fromSocket with test seams (see IdentityTestHooks.h).
  static Result<std::shared_ptr<const PeerIdentity>> fromSocketForTesting(
      int connectedFd, const IdentityTestHooks& hooks);

  PeerIdentity(const PeerIdentity&) = delete;
  PeerIdentity& operator=(const PeerIdentity&) = delete;

  // Credentials as they were when the peer connected (effective ids).
  pid_t pid() const { return pid_; }
  uid_t uid() const { return uid_; }
  gid_t gid() const { return gid_; }
  // Clock ticks since boot; with the pid it names the process for good.
  std::uint64_t startTime() const { return startTime_; }

  // Canonical and absolute, as the daemon's file system sees it.
  const std::string& executablePath() const { return executablePath_; }
  dev_t executableDevice() const { return executableDevice_; }
  ino_t executableInode() const { return executableInode_; }
  // The file at executablePath() is no longer the one running: it was
  // removed or replaced after the program started.
  bool executableWasReplaced() const { return executableWasReplaced_; }

  const Confinement& confinement() const { return confinement_; }
  int seccompMode() const { return confinement_.seccompMode; }
  bool noNewPrivs() const { return confinement_.noNewPrivs; }
  const std::string& securityLabel() const { return confinement_.securityLabel; }
  std::uint64_t mountNamespace() const { return confinement_.mountNamespace; }
  // See Confinement::isSandboxedRelativeTo; `daemon` comes from ofSelf().
  bool isSandboxedRelativeTo(const PeerIdentity& daemon) const {
    return confinement_.isSandboxedRelativeTo(daemon.confinement_);
  }

  // True while the process is still running: /proc/<pid> exists, is not a
  // zombie, and shows the start time taken at accept, so a process that
  // later got the same pid is never taken for the peer. Never blocks. The
  // identity holds no descriptor, so that a daemon with many clients pays
  // one descriptor (the socket) per connection.
  bool isAlive() const;

  // "pid 123 (uid 0) /usr/bin/x", with " (replaced)" after a replaced
  // executable.
  std::string description() const;

 private:
  friend class internal::IdentityTaker;
  PeerIdentity() = default;

  pid_t pid_ = 0;
  uid_t uid_ = 0;
  gid_t gid_ = 0;
  std::uint64_t startTime_ = 0;
  std::string executablePath_;
  dev_t executableDevice_ = 0;
  ino_t executableInode_ = 0;
  bool executableWasReplaced_ = false;
  Confinement confinement_;
};

}  // namespace platform::mbx
