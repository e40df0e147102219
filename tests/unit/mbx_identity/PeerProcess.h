// A real client process for the identity tests: the identity peer program (or
// a copy of it) started against a listening socket of the test's own, its
// connection accepted, and its first answer read. Use from one thread.
#pragma once

#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <memory>

#include "platform/mbx/identity/internal/UniqueFd.h"

extern char** environ;

namespace platform::mbx::testing {

inline constexpr const char* kPeerProgram = IDENTITY_PEER_PATH;
inline constexpr const char* kExecTargetProgram = EXEC_TARGET_PATH;

// A fresh directory under /tmp, removed with everything in it.
struct TempDir {
  TempDir() : path(::mkdtemp(std::string("/tmp/qv-identity-XXXXXX").data())) {}
  ~TempDir() {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
  }
  std::string path;
};

class PeerProcess {
 public:
  // Runs `program` with `mode` (see IdentityPeerMain.cpp). Reports a test
  // failure and returns null when it does not connect and answer.
  static std::unique_ptr<PeerProcess> start(const std::string& program, const std::string& mode) {
    std::unique_ptr<PeerProcess> peer(new PeerProcess());
    std::string args[] = {program, peer->dir_.path + "/socket", kExecTargetProgram, mode};
    internal::UniqueFd listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
    struct sockaddr_un address {};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, args[1].c_str(), sizeof address.sun_path - 1);
    char* argv[] = {args[0].data(), args[1].data(), args[2].data(), args[3].data(), nullptr};
    if (::bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
        ::listen(listener.get(), 1) != 0 ||
        ::posix_spawn(&peer->pid_, program.c_str(), nullptr, nullptr, argv, environ) != 0) {
      peer->pid_ = -1;
      ADD_FAILURE() << "cannot start " << program;
      return nullptr;
    }
    if (waitReadable(listener.get()))
      peer->connection_.reset(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
    if (!peer->readByte(&peer->reply_)) {
      ADD_FAILURE() << program << " did not connect and answer";
      return nullptr;
    }
    return peer;
  }
  ~PeerProcess() {
    connection_.reset();
    if (pid_ > 0 && !reaped_) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
  }

  pid_t pid() const { return pid_; }
  int connection() const { return connection_.get(); }  // the daemon's end
  char reply() const { return reply_; }                 // 'R' ready, 'F' failed

  // Makes the peer run the exec target, keeping the connection; true once
  // the target has answered.
  bool execTarget() {
    char answer = 0;
    return ::send(connection(), "e", 1, MSG_NOSIGNAL) == 1 && readByte(&answer) && answer == 'X';
  }

  // Makes the peer exit and waits until it has; with Reap::No it stays a
  // zombie until quit(Reap::Yes).
  enum class Reap { Yes, No };
  bool quit(Reap reap) {
    // A peer that already exited (a zombie) has nothing left to tell.
    if (::send(connection(), "q", 1, MSG_NOSIGNAL) != 1 && errno != EPIPE) return false;
    if (reap == Reap::Yes) return reaped_ = ::waitpid(pid_, nullptr, 0) == pid_;
    siginfo_t info{};
    return ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOWAIT) == 0;
  }

 private:
  static bool waitReadable(int fd) {
    struct pollfd entry = {fd, POLLIN, 0};
    return ::poll(&entry, 1, 10'000) == 1;
  }
  bool readByte(char* byte) {
    return waitReadable(connection()) && ::read(connection(), byte, 1) == 1;
  }

  TempDir dir_;
  internal::UniqueFd connection_;
  pid_t pid_ = -1;
  bool reaped_ = false;
  char reply_ = 0;
};

}  // namespace platform::mbx::testing
