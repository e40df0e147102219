#include "platform/mbx/identity/internal/Pidfd.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cerrno>
#include <charconv>
#include <optional>
#include <string>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/ProcDir.h"

namespace platform::mbx::internal {
namespace {

// Linux 6.5 added the option; older C library headers do not name it.
#ifdef SO_PEERPIDFD
constexpr int kPeerPidfdOption = SO_PEERPIDFD;
#else
constexpr int kPeerPidfdOption = 77;
#endif

// An fdinfo file is a handful of short lines.
constexpr std::size_t kFdinfoLimit = 4 * 1024;

}  // namespace

Result<UniqueFd> openPidfd(pid_t pid) {
  // Always close-on-exec, so no child inherits the handle.
  const long fd = ::syscall(SYS_pidfd_open, pid, 0);
  if (fd < 0) return Error::posix(errno, "pidfd_open " + std::to_string(pid));
  return UniqueFd(static_cast<int>(fd));
}

Result<UniqueFd> peerPidfd(int socketFd) {
  int fd = -1;
  socklen_t length = sizeof fd;
  if (::getsockopt(socketFd, SOL_SOCKET, kPeerPidfdOption, &fd, &length) != 0) {
    // ENOPROTOOPT: a kernel from before the option.
    if (errno == ENOPROTOOPT) return UniqueFd();
    // The first kernels with the option refuse a peer that is already gone
    // with EINVAL rather than ESRCH; both mean the same here.
    if (errno == EINVAL || errno == ESRCH) return Error::posix(ESRCH, "SO_PEERPIDFD");
    return Error::posix(errno, "SO_PEERPIDFD");
  }
  UniqueFd pidfd(fd);
  if (length != sizeof fd || fd < 0) return Error::posix(EPROTO, "SO_PEERPIDFD");
  // The kernel sets close-on-exec already; a kernel that did not would leak
  // the handle into the daemon's children.
  if (::fcntl(pidfd.get(), F_SETFD, FD_CLOEXEC) != 0) return Error::posix(errno, "fcntl pidfd");
  return pidfd;
}

Liveness livenessOf(int pidfd) {
  struct pollfd entry {};
  entry.fd = pidfd;
  entry.events = POLLIN;
  for (;;) {
    const int ready = ::poll(&entry, 1, 0);
    if (ready == 0) return Liveness::Alive;
    if (ready < 0 && errno == EINTR) continue;
    // Readable (exited), hung up (reaped), or an error.
    return Liveness::Exited;
  }
}

Result<pid_t> pidOfPidfd(int pidfd) {
  Result<ProcDir> self = ProcDir::open(::getpid());
  if (!self) return self.error();
  const std::string name = "fdinfo/" + std::to_string(pidfd);
  Result<std::string> text = self->readFile(name.c_str(), kFdinfoLimit);
  if (!text) return text.error();
  return parsePidfdInfo(*text);
}

Result<pid_t> parsePidfdInfo(std::string_view text) {
  if (text.size() > kFdinfoLimit) {
    return identityError(IdentityErrorCode::TooLong, "pidfd fdinfo: too long");
  }
  std::optional<pid_t> pid;
  while (!text.empty()) {
    const std::size_t newline = text.find('\n');
    std::string_view line = text.substr(0, newline);
    text.remove_prefix(newline == std::string_view::npos ? text.size() : newline + 1);
    if (!line.starts_with("Pid:")) continue;
    line.remove_prefix(4);
    while (!line.empty() && (line.front() == ' ' || line.front() == '\t')) line.remove_prefix(1);
    pid_t value = 0;
    const auto [end, ec] = std::from_chars(line.data(), line.data() + line.size(), value);
    if (pid || line.empty() || ec != std::errc() || end != line.data() + line.size()) {
      return identityError(IdentityErrorCode::MalformedProcFile, "pidfd fdinfo: bad Pid line");
    }
    pid = value;
  }
  if (!pid) return identityError(IdentityErrorCode::MalformedProcFile, "pidfd fdinfo: no Pid line");
  return *pid;
}

}  // namespace platform::mbx::internal
