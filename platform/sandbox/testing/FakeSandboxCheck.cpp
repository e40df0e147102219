#include "platform/sandbox/testing/FakeSandboxCheck.h"

namespace platform::sandbox {

FakeSandboxCheck::FakeSandboxCheck(Sandboxing byDefault) : default_(byDefault) {}

void FakeSandboxCheck::setDefault(Sandboxing answer) {
  std::lock_guard<std::mutex> lock(mu_);
  default_ = answer;
}

void FakeSandboxCheck::setForPid(pid_t pid, Sandboxing answer) {
  std::lock_guard<std::mutex> lock(mu_);
  byPid_.insert_or_assign(pid, answer);
}

bool FakeSandboxCheck::isSandboxed(const mbx::PeerIdentity& peer) const {
  std::lock_guard<std::mutex> lock(mu_);
  auto found = byPid_.find(peer.pid());
  return (found != byPid_.end() ? found->second : default_) == Sandboxing::Sandboxed;
}

}  // namespace platform::sandbox
