#include "platform/mbx/identity/PeerIdentity.h"

#include "platform/mbx/identity/internal/IdentityTaker.h"
#include "platform/mbx/identity/internal/ProcDir.h"

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
  Result<internal::ProcDir> dir = internal::ProcDir::open(pid_);
  if (!dir) return false;
  Result<internal::ProcStat> stat = dir->readStat();
  if (!stat) return false;
  return stat->startTime == startTime_ && stat->state != 'Z' && stat->state != 'X';
}

std::string PeerIdentity::description() const {
  std::string text =
      "pid " + std::to_string(pid_) + " (uid " + std::to_string(uid_) + ") " + executablePath_;
  if (executableWasReplaced_) text += " (replaced)";
  return text;
}

}  // namespace platform::mbx
