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

#include <algorithm>
#include <cstring>
#include <filesystem>
#include <thread>

#include "platform/cbor/Cbor.h"
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

std::string TemporaryRoot::socketPath(const std::string& service) const {
  return path_ + "/run/quorvex/mbx/" + service;
}

Bytes frameBytes(FrameKind kind, std::uint64_t id, const Value& body, std::uint64_t inReplyTo) {
  Bytes frame = encodeFrame(kind, inReplyTo, body).value();
  setMessageId(frame, id);
  return frame;
}

Bytes rawFrame(const FrameHeader& header, const Bytes& body) {
  Bytes frame(kFrameHeaderSize);
  writeHeader(header, std::span<std::uint8_t, kFrameHeaderSize>(frame.data(), kFrameHeaderSize));
  frame.insert(frame.end(), body.begin(), body.end());
  return frame;
}

Bytes cborOf(const Value& value) {
  return cbor::encode(value).value();
}

Bytes concat(std::initializer_list<Bytes> parts) {
  Bytes all;
  for (const Bytes& part : parts) all.insert(all.end(), part.begin(), part.end());
  return all;
}

namespace {

// Child side of RawPeer: system calls only, then _exit.
[[noreturn]] void runRawChild(const sockaddr_un& address, const Bytes& bytes, RawAfter after,
                              int releaseFd) {
  int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  if (fd < 0 || ::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    ::_exit(1);
  }
  std::size_t offset = 0;
  while (offset < bytes.size()) {
    ssize_t n = ::send(fd, bytes.data() + offset, bytes.size() - offset, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;  // the server closed: fine, the rest is moot
    offset += static_cast<std::size_t>(n);
  }
  if (after == RawAfter::HoldUntilReleased) {
    pollfd p{releaseFd, POLLIN, 0};
    ::poll(&p, 1, 30000);
    ::_exit(0);
  }
  if (after == RawAfter::ShutdownThenAwaitEof) ::shutdown(fd, SHUT_WR);
  char sink[4096];
  for (;;) {
    pollfd p{fd, POLLIN, 0};
    int ready = ::poll(&p, 1, 10000);
    if (ready == 0) ::_exit(2);
    if (ready < 0) continue;
    ssize_t n = ::read(fd, sink, sizeof sink);
    if (n == 0 || (n < 0 && errno != EINTR && errno != EAGAIN)) ::_exit(0);
  }
}

}  // namespace

RawPeer::RawPeer(const std::string& socketPath, Bytes bytes, RawAfter after) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, socketPath.data(),
              std::min(socketPath.size(), sizeof address.sun_path - 1));
  int pipeFds[2];
  if (::pipe2(pipeFds, O_CLOEXEC) != 0) return;
  pid_ = ::fork();
  if (pid_ == 0) {
    ::close(pipeFds[1]);
    runRawChild(address, bytes, after, pipeFds[0]);
  }
  ::close(pipeFds[0]);
  releaseFd_ = pipeFds[1];
}

RawPeer::~RawPeer() {
  release();
  wait();
}

void RawPeer::release() {
  if (releaseFd_ >= 0) {
    ::close(releaseFd_);
    releaseFd_ = -1;
  }
}

int RawPeer::wait() {
  if (pid_ > 0 && status_ < 0) {
    int raw = 0;
    while (::waitpid(pid_, &raw, 0) < 0 && errno == EINTR) {
    }
    status_ = WIFEXITED(raw) ? WEXITSTATUS(raw) : 100;
  }
  return status_;
}

PeerProcess::PeerProcess(const std::vector<std::string>& arguments) {
  int in[2];
  int out[2];
  if (::pipe2(in, O_CLOEXEC) != 0 || ::pipe2(out, O_CLOEXEC) != 0) return;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, in[0], 0);
  posix_spawn_file_actions_adddup2(&actions, out[1], 1);
  std::vector<std::string> all{MBX_TEST_PEER_PATH};
  all.insert(all.end(), arguments.begin(), arguments.end());
  std::vector<char*> argv;
  for (std::string& argument : all) argv.push_back(argument.data());
  argv.push_back(nullptr);
  if (::posix_spawn(&pid_, MBX_TEST_PEER_PATH, &actions, nullptr, argv.data(), environ) != 0) {
    pid_ = -1;
  }
  posix_spawn_file_actions_destroy(&actions);
  ::close(in[0]);
  ::close(out[1]);
  stdinFd_ = in[1];
  stdoutFd_ = out[0];
}

PeerProcess::~PeerProcess() {
  closeStdin();
  wait(5s);
  if (stdoutFd_ >= 0) ::close(stdoutFd_);
}

bool PeerProcess::waitForLine(const std::string& line, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  for (;;) {
    std::size_t end;
    while ((end = pendingOutput_.find('\n')) != std::string::npos) {
      std::string got = pendingOutput_.substr(0, end);
      pendingOutput_.erase(0, end + 1);
      if (got == line) return true;
    }
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return false;
    pollfd p{stdoutFd_, POLLIN, 0};
    if (::poll(&p, 1, static_cast<int>(left.count())) <= 0) continue;
    char buffer[256];
    ssize_t n = ::read(stdoutFd_, buffer, sizeof buffer);
    if (n <= 0) return false;
    pendingOutput_.append(buffer, static_cast<std::size_t>(n));
  }
}

void PeerProcess::closeStdin() {
  if (stdinFd_ >= 0) {
    ::close(stdinFd_);
    stdinFd_ = -1;
  }
}

int PeerProcess::wait(std::chrono::milliseconds limit) {
  if (pid_ <= 0 || status_ != -2) return status_;
  const auto deadline = std::chrono::steady_clock::now() + limit;
  int raw = 0;
  for (;;) {
    pid_t done = ::waitpid(pid_, &raw, WNOHANG);
    if (done == pid_) {
      status_ = WIFEXITED(raw) ? WEXITSTATUS(raw) : 100 + (WIFSIGNALED(raw) ? WTERMSIG(raw) : 0);
      return status_;
    }
    if (std::chrono::steady_clock::now() > deadline) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, &raw, 0);
      status_ = -1;
      return status_;
    }
    std::this_thread::sleep_for(2ms);
  }
}

void Recorder::add(std::string entry) {
  std::lock_guard<std::mutex> lock(mu_);
  entries_.push_back(std::move(entry));
}

std::vector<std::string> Recorder::entries() const {
  std::lock_guard<std::mutex> lock(mu_);
  return entries_;
}

std::size_t Recorder::size() const {
  std::lock_guard<std::mutex> lock(mu_);
  return entries_.size();
}

std::size_t Recorder::count(const std::string& entry) const {
  std::lock_guard<std::mutex> lock(mu_);
  return static_cast<std::size_t>(std::count(entries_.begin(), entries_.end(), entry));
}

}  // namespace platform::mbx::testing
