// The sandbox check on Linux: a peer is sandboxed when it is confined beyond
// the daemon (a seccomp filter, NoNewPrivs, an LSM profile or a mount
// namespace the daemon does not share; see mbx::Confinement). The daemon's
// own identity is taken once, when the check is made, so that each question
// costs no system call.
//
// Thread safety: immutable after creation; safe from any thread.
#pragma once

#include <memory>

#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/sandbox/SandboxCheck.h"
#include "platform/values/Result.h"

namespace platform::sandbox {

class LinuxSandboxCheck final : public SandboxCheck {
 public:
  // Takes this process's identity. Fails when /proc cannot describe it.
  static Result<std::unique_ptr<LinuxSandboxCheck>> create();

  // Judges peers against `daemon`, which would normally be
  // PeerIdentity::ofSelf().
  // REQUIRES: daemon is not null.
  explicit LinuxSandboxCheck(std::shared_ptr<const mbx::PeerIdentity> daemon);

  bool isSandboxed(const mbx::PeerIdentity& peer) const override;

  const mbx::PeerIdentity& daemonIdentity() const { return *daemon_; }

 private:
  const std::shared_ptr<const mbx::PeerIdentity> daemon_;
};

}  // namespace platform::sandbox
