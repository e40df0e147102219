#include "platform/lumend/internal/ProcessHandle.h"

#include <errno.h>
#include <poll.h>
#include <signal.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <vector>

#include "platform/dispatch/ScopedBlockingCall.h"

namespace platform::lumend::internal {

Result<ProcessHandle> ProcessHandle::open(pid_t pid) {
  const long fd = ::syscall(SYS_pidfd_open, pid, 0);
  if (fd < 0) return Error::posix(errno, "pidfd_open " + std::to_string(pid));
  return ProcessHandle(pid, static_cast<int>(fd));
}

ProcessHandle& ProcessHandle::operator=(ProcessHandle&& other) noexcept {
  if (this != &other) {
    if (fd_ >= 0) ::close(fd_);
    pid_ = other.pid_;
    fd_ = std::exchange(other.fd_, -1);
  }
  return *this;
}

ProcessHandle::~ProcessHandle() {
  if (fd_ >= 0) ::close(fd_);
}

int ProcessHandle::signal(int number) const {
  return ::syscall(SYS_pidfd_send_signal, fd_, number, nullptr, 0) == 0 ? 0 : errno;
}

bool ProcessHandle::exited() const {
  struct pollfd entry = {fd_, POLLIN, 0};
  // A pidfd that cannot be polled is taken for an ended process: waiting on
  // it would never end.
  return ::poll(&entry, 1, 0) != 0;
}

std::size_t awaitExit(std::span<const ProcessHandle> handles, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  dispatch::ScopedBlockingCall blocking;
  for (;;) {
    std::vector<struct pollfd> running;
    for (const ProcessHandle& handle : handles) {
      if (!handle.exited()) running.push_back({handle.descriptor(), POLLIN, 0});
    }
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (running.empty() || left.count() <= 0) return running.size();
    // Any one exit wakes the poll; the loop then looks at the others again.
    ::poll(running.data(), running.size(), static_cast<int>(left.count()) + 1);
  }
}

}  // namespace platform::lumend::internal
