// Whether a client counts as sandboxed: the daemon asks this of every peer,
// since a sandboxed host may only use plug-ins and files it is given
// explicitly. LinuxSandboxCheck judges the peer's confinement against the
// daemon's own; testing/FakeSandboxCheck answers what a test set.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include "platform/mbx/identity/PeerIdentity.h"

namespace platform::sandbox {

class SandboxCheck {
 public:
  virtual ~SandboxCheck() = default;

  // True when `peer` is held in more than the daemon itself is.
  virtual bool isSandboxed(const mbx::PeerIdentity& peer) const = 0;
};

}  // namespace platform::sandbox
