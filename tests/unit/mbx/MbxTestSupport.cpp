#include "tests/unit/mbx/MbxTestSupport.h"

#include <fcntl.h>
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
#include <thread>

#include "platform/root/Root.h"

extern char** environ;

namespace platform::mbx::testing {

bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  while (!done()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(1ms);
  }
  return true;
}

TemporaryRoot::TemporaryRoot() {
  char pattern[] = "/tmp/mbx-XXXXXX";
  const char* made = ::mkdtemp(pattern);
  path_ = made != nullptr ? made : "/tmp";
  setRootDirectoryForTesting(path_);
  ::setenv("QV_ROOT", path_.c_str(), 1);
}

TemporaryRoot::~TemporaryRoot() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

Bytes frameBytes(FrameKind kind, std::uint64_t id, const Value& body, std::uint64_t inReplyTo) {
  Bytes frame = encodeFrame(kind, inReplyTo, body).value();
  setMessageId(frame, id);
  return frame;
}

Bytes concat(std::initializer_list<Bytes> parts) {
  Bytes all;
  for (const Bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

// True when `fd` becomes readable within `ms`.
static bool readable(int fd, int ms) {
  pollfd p{fd, POLLIN, 0};
  return ::poll(&p, 1, ms) == 1;
}

RawPeer::RawPeer(const std::string& socketPath, Bytes bytes, RawAfter after) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  int pipeFds[2];
  if (::pipe2(pipeFds, O_CLOEXEC) != 0) return;
  pid_ = ::fork();
  if (pid_ != 0) {
    ::close(pipeFds[0]);
    releaseFd_ = pipeFds[1];
    return;
  }
  // The child: system calls only, then _exit.
  ::close(pipeFds[1]);
  const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) ::_exit(1);
  for (std::size_t at = 0; at < bytes.size();) {
    const ssize_t n = ::send(fd, bytes.data() + at, bytes.size() - at, MSG_NOSIGNAL);
    if (n <= 0 && errno != EINTR) break;  // the server closed: the rest is moot
    at += n > 0 ? static_cast<std::size_t>(n) : 0;
  }
  if (after == RawAfter::HoldUntilReleased) {
    readable(pipeFds[0], 30000);
    ::_exit(0);
  }
  if (after == RawAfter::ShutdownThenAwaitEof) ::shutdown(fd, SHUT_WR);
  char sink[4096];
  for (;;) {
    if (!readable(fd, 10000)) ::_exit(2);
    const ssize_t n = ::read(fd, sink, sizeof sink);
    if (n == 0 || (n < 0 && errno != EINTR && errno != EAGAIN)) ::_exit(0);
  }
}

void RawPeer::release() {
  if (releaseFd_ >= 0) ::close(releaseFd_);
  releaseFd_ = -1;
}

int RawPeer::wait() {
  int raw = 0;
  if (pid_ > 0 && status_ < 0 && ::waitpid(pid_, &raw, 0) == pid_)
    status_ = WIFEXITED(raw) ? WEXITSTATUS(raw) : 100;
  return status_;
}

PeerProcess::PeerProcess(const std::vector<std::string>& arguments) {
  int in[2];
  if (::pipe2(in, O_CLOEXEC) != 0) return;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, in[0], 0);
  std::vector<std::string> all{MBX_TEST_PEER_PATH};
  all.insert(all.end(), arguments.begin(), arguments.end());
  std::vector<char*> argv;
  for (std::string& argument : all) argv.push_back(argument.data());
  argv.push_back(nullptr);
  if (::posix_spawn(&pid_, MBX_TEST_PEER_PATH, &actions, nullptr, argv.data(), environ) != 0)
    pid_ = -1;
  posix_spawn_file_actions_destroy(&actions);
  ::close(in[0]);
  stdinFd_ = in[1];
}

int PeerProcess::wait() {
  if (stdinFd_ >= 0) ::close(stdinFd_);
  stdinFd_ = -1;
  if (pid_ <= 0 || status_ != -2) return status_;
  int raw = 0;
  if (!eventually([&] { return ::waitpid(pid_, &raw, WNOHANG) == pid_; })) {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, &raw, 0);
    return status_ = -1;
  }
  return status_ = WIFEXITED(raw) ? WEXITSTATUS(raw) : 100 + (WIFSIGNALED(raw) ? WTERMSIG(raw) : 0);
}

}  // namespace platform::mbx::testing
