// A SandboxCheck that answers what a test set: per pid, else a default.
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <sys/types.h>

#include <map>
#include <mutex>

#include "platform/sandbox/SandboxCheck.h"

namespace platform::sandbox {

enum class Sandboxing { NotSandboxed, Sandboxed };

class FakeSandboxCheck final : public SandboxCheck {
 public:
  explicit FakeSandboxCheck(Sandboxing byDefault = Sandboxing::NotSandboxed);

  void setDefault(Sandboxing answer);
  // The answer for the peer with `pid`, overriding the default.
  void setForPid(pid_t pid, Sandboxing answer);

  bool isSandboxed(const mbx::PeerIdentity& peer) const override;

 private:
  mutable std::mutex mu_;
  Sandboxing default_;
  std::map<pid_t, Sandboxing> byPid_;
};

}  // namespace platform::sandbox
