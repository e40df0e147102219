#include "platform/mbx/identity/Confinement.h"

namespace platform::mbx {
namespace {

constexpr int kSeccompFilterMode = 2;

}  // namespace

bool Confinement::isSandboxedRelativeTo(const Confinement& daemon) const {
  return !sandboxReasonsRelativeTo(daemon).empty();
}

std::string Confinement::sandboxReasonsRelativeTo(const Confinement& daemon) const {
  std::string reasons;
  auto add = [&reasons](std::string_view reason) {
    if (!reasons.empty()) reasons += ", ";
    reasons += reason;
  };
  if (seccompMode == kSeccompFilterMode && daemon.seccompMode != kSeccompFilterMode) {
    add("seccomp filter");
  }
  if (noNewPrivs && !daemon.noNewPrivs) add("no-new-privs");
  if (!securityLabel.empty() && securityLabel != kUnconfinedLabel &&
      securityLabel != daemon.securityLabel) {
    add("security label");
  }
  if (mountNamespace != daemon.mountNamespace) add("mount namespace");
  return reasons;
}

}  // namespace platform::mbx
