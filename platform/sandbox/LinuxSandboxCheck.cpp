#include "platform/sandbox/LinuxSandboxCheck.h"

#include <cassert>
#include <utility>

#include "platform/log/LoggerRegistry.h"

#include "platform/sandbox/internal/SandboxLog.h"

namespace platform::sandbox {
namespace {

using internal::sandboxLog;

}  // namespace

Result<std::unique_ptr<LinuxSandboxCheck>> LinuxSandboxCheck::create() {
  Result<std::shared_ptr<const mbx::PeerIdentity>> self = mbx::PeerIdentity::ofSelf();
  if (!self.ok()) return self.error();
  return std::make_unique<LinuxSandboxCheck>(std::move(self).value());
}

LinuxSandboxCheck::LinuxSandboxCheck(std::shared_ptr<const mbx::PeerIdentity> daemon)
    : daemon_(std::move(daemon)) {
  assert(daemon_ != nullptr);
}

bool LinuxSandboxCheck::isSandboxed(const mbx::PeerIdentity& peer) const {
  if (!peer.isSandboxedRelativeTo(*daemon_)) return false;
  const log::Logger& logger = sandboxLog();
  if (logger.isEnabled(log::Level::Debug)) {
    logger.debug("%{public}s is sandboxed: %{public}s", peer.description(),
                 peer.confinement().sandboxReasonsRelativeTo(daemon_->confinement()));
  }
  return true;
}

}  // namespace platform::sandbox
