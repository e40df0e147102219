// A real client process for the identity tests: the identity peer program (or
// a copy of it) started against a listening socket of the test's own, its
// connection accepted, and its first answer read.
//
// Thread safety: use from one thread.
#pragma once

#include <sys/types.h>

#include <memory>
#include <string>

#include "platform/mbx/identity/internal/UniqueFd.h"

namespace platform::mbx::testing {

// The programs built beside the tests.
inline constexpr const char* kPeerProgram = IDENTITY_PEER_PATH;
inline constexpr const char* kExecTargetProgram = EXEC_TARGET_PATH;

// A fresh directory under /tmp, removed with everything in it.
class TempDir {
 public:
  TempDir();
  ~TempDir();
  TempDir(const TempDir&) = delete;
  TempDir& operator=(const TempDir&) = delete;
  const std::string& path() const { return path_; }

 private:
  std::string path_;
};

class PeerProcess {
 public:
  // Runs `program` with `mode` (see IdentityPeerMain.cpp) and `name`. Reports
  // a test failure and returns null when it does not connect and answer.
  static std::unique_ptr<PeerProcess> start(const std::string& program, const std::string& mode,
                                            const std::string& name = "");
  ~PeerProcess();
  PeerProcess(const PeerProcess&) = delete;
  PeerProcess& operator=(const PeerProcess&) = delete;

  pid_t pid() const { return pid_; }
  // The daemon's end of the connection: what fromSocket is given.
  int connection() const { return connection_.get(); }
  // 'R' ready, 'S' not permitted here, 'F' failed.
  char reply() const { return reply_; }

  // Makes the peer run the exec target, keeping the connection; true once
  // the target has answered.
  bool execTarget();

  enum class Reap { Yes, No };
  // Makes the peer exit and waits until it has; with Reap::No it stays a
  // zombie until quit(Reap::Yes).
  bool quit(Reap reap);

 private:
  PeerProcess() = default;
  bool readByte(char* byte);
  bool send(char command);

  TempDir dir_;
  internal::UniqueFd connection_;
  pid_t pid_ = -1;
  bool reaped_ = false;
  char reply_ = 0;
};

}  // namespace platform::mbx::testing
