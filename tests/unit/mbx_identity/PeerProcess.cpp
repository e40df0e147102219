#include "tests/unit/mbx_identity/PeerProcess.h"

#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <vector>

#include <gtest/gtest.h>

extern char** environ;

namespace platform::mbx::testing {
namespace {

constexpr int kTimeoutMs = 10'000;

bool waitReadable(int fd) {
  struct pollfd entry {
    fd, POLLIN, 0
  };
  return ::poll(&entry, 1, kTimeoutMs) == 1;
}

}  // namespace

TempDir::TempDir() {
  char pattern[] = "/tmp/qv-identity-XXXXXX";
  if (::mkdtemp(pattern) == nullptr) ADD_FAILURE() << "mkdtemp: " << std::strerror(errno);
  path_ = pattern;
}

TempDir::~TempDir() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

std::unique_ptr<PeerProcess> PeerProcess::start(const std::string& program, const std::string& mode,
                                                const std::string& name) {
  std::unique_ptr<PeerProcess> peer(new PeerProcess());
  const std::string socketPath = peer->dir_.path() + "/socket";
  internal::UniqueFd listener(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  struct sockaddr_un address {};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  if (!listener.valid() ||
      ::bind(listener.get(), reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listener.get(), 1) != 0) {
    ADD_FAILURE() << "listen on " << socketPath << ": " << std::strerror(errno);
    return nullptr;
  }

  std::vector<std::string> args = {program, socketPath, kExecTargetProgram, mode};
  if (!name.empty()) args.push_back(name);
  std::vector<char*> argv;
  for (std::string& arg : args) argv.push_back(arg.data());
  argv.push_back(nullptr);
  const int spawned =
      ::posix_spawn(&peer->pid_, program.c_str(), nullptr, nullptr, argv.data(), environ);
  if (spawned != 0) {
    peer->pid_ = -1;
    ADD_FAILURE() << "spawn " << program << ": " << std::strerror(spawned);
    return nullptr;
  }
  if (!waitReadable(listener.get())) {
    ADD_FAILURE() << program << " did not connect";
    return nullptr;
  }
  peer->connection_.reset(::accept4(listener.get(), nullptr, nullptr, SOCK_CLOEXEC));
  if (!peer->connection_.valid() || !peer->readByte(&peer->reply_)) {
    ADD_FAILURE() << program << " did not answer";
    return nullptr;
  }
  return peer;
}

PeerProcess::~PeerProcess() {
  connection_.reset();
  if (pid_ > 0 && !reaped_) {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
}

bool PeerProcess::readByte(char* byte) {
  return waitReadable(connection_.get()) && ::read(connection_.get(), byte, 1) == 1;
}

bool PeerProcess::send(char command) {
  return ::send(connection_.get(), &command, 1, MSG_NOSIGNAL) == 1;
}

bool PeerProcess::execTarget() {
  char answer = 0;
  return send('e') && readByte(&answer) && answer == 'X';
}

bool PeerProcess::quit(Reap reap) {
  // A peer that already exited (a zombie) has nothing left to tell.
  if (!send('q') && errno != EPIPE) return false;
  if (reap == Reap::Yes) {
    reaped_ = ::waitpid(pid_, nullptr, 0) == pid_;
    return reaped_;
  }
  siginfo_t info{};
  return ::waitid(P_PID, static_cast<id_t>(pid_), &info, WEXITED | WNOWAIT) == 0;
}

}  // namespace platform::mbx::testing
