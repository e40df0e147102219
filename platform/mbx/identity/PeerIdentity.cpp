#include "platform/mbx/identity/PeerIdentity.h"

#include "platform/mbx/identity/internal/IdentityTaker.h"
#include "platform/mbx/identity/internal/Pidfd.h"

namespace platform::mbx {

Result<std::shared_ptr<const PeerIdentity>> PeerIdentity::fromSocket(int connectedFd) {
  return internal::IdentityTaker::fromSocket(connectedFd, IdentityTestHooks{});
}

Result<std::shared_ptr<const PeerIdentity>> PeerIdentity::ofSelf() {
  return internal::IdentityTaker::ofSelf();
}

Result<std::shared_ptr<const PeerIdentity>> PeerIdentity::fromSocketForTesting(
    int connectedFd, const IdentityTestHooks& hooks) {
  return internal::IdentityTaker::fromSocket(connectedFd, hooks);
}

bool PeerIdentity::isAlive() const {
  return internal::livenessOf(pidfd_.get()) == internal::Liveness::Alive;
}

std::string PeerIdentity::description() const {
  std::string text =
      "pid " + std::to_string(pid_) + " (uid " + std::to_string(uid_) + ") " + executablePath_;
  if (executableWasReplaced_) text += " (replaced)";
  return text;
}

}  // namespace platform::mbx
