#include "platform/mbx/internal/ServiceSocket.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <system_error>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/mbx/MbxError.h"
#include "platform/root/Root.h"

namespace platform::mbx::internal {

namespace {

Error socketError(int err, std::string_view call, const std::string& path) {
  std::string detail(call);
  detail += " ";
  detail += path;
  detail += ": ";
  detail += std::strerror(err);
  return makeError(ErrorCode::SocketFailure, detail);
}

sockaddr_un addressOf(const std::string& path) {
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, path.data(), path.size());  // servicePath checked the size
  return address;
}

int connectOnce(int fd, const std::string& path) {
  sockaddr_un address = addressOf(path);
  if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) return 0;
  return errno;
}

// Whether a listener still answers at `path`. Asks without waiting: a full
// backlog (EAGAIN) also means somebody is there.
bool isLive(const std::string& path) {
  int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return true;  // cannot tell: never take a name that may be in use
  int err = connectOnce(fd, path);
  ::close(fd);
  return err != ECONNREFUSED && err != ENOENT;
}

}  // namespace

Status checkServiceName(std::string_view name) {
  if (name.empty()) return makeError(ErrorCode::BadServiceName, "empty name");
  if (name == "." || name.find("..") != std::string_view::npos) {
    return makeError(ErrorCode::BadServiceName, "a name may not contain \"..\" or be \".\"");
  }
  for (char c : name) {
    if (c == '/') return makeError(ErrorCode::BadServiceName, "a name may not contain '/'");
    if (static_cast<unsigned char>(c) < 0x20 || c == 0x7f) {
      return makeError(ErrorCode::BadServiceName, "a name may not contain control bytes");
    }
  }
  return okStatus();
}

Result<std::string> servicePath(std::string_view name) {
  if (Status checked = checkServiceName(name); !checked.ok()) return checked.error();
  std::string relative(kServiceDirectory);
  relative += '/';
  relative += name;
  std::string path = rootPath(relative);
  if (path.size() + 1 > sizeof(sockaddr_un{}.sun_path)) {
    return makeError(ErrorCode::BadServiceName,
                     "socket path of " + std::to_string(path.size()) + " bytes is too long");
  }
  return path;
}

Result<BoundSocket> listenAt(const std::string& path) {
  std::error_code ec;
  std::filesystem::create_directories(std::filesystem::path(path).parent_path(), ec);
  if (ec) return socketError(ec.value(), "mkdir for", path);

  int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
  if (fd < 0) return socketError(errno, "socket for", path);
  sockaddr_un address = addressOf(path);
  // Two tries: the second after removing a stale socket file.
  for (int attempt = 0;; ++attempt) {
    if (::bind(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) == 0) break;
    int err = errno;
    if (err != EADDRINUSE || attempt > 0) {
      ::close(fd);
      return socketError(err, "bind", path);
    }
    struct stat st {};
    if (::lstat(path.c_str(), &st) == 0 && !S_ISSOCK(st.st_mode)) {
      ::close(fd);
      return makeError(ErrorCode::ServiceInUse, path + " exists and is not a socket");
    }
    if (isLive(path)) {
      ::close(fd);
      return makeError(ErrorCode::ServiceInUse, "a listener answers at " + path);
    }
    if (::unlink(path.c_str()) != 0 && errno != ENOENT) {
      err = errno;
      ::close(fd);
      return socketError(err, "unlink stale", path);
    }
  }
  struct stat st {};
  if (::chmod(path.c_str(), 0666) != 0 || ::lstat(path.c_str(), &st) != 0) {
    int err = errno;
    ::close(fd);
    return socketError(err, "chmod", path);
  }
  if (::listen(fd, SOMAXCONN) != 0) {
    int err = errno;
    ::unlink(path.c_str());
    ::close(fd);
    return socketError(err, "listen", path);
  }
  return BoundSocket{fd, st.st_dev, st.st_ino};
}

Result<int> connectTo(const std::string& path) {
  int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return socketError(errno, "socket for", path);
  int err;
  {
    // A full backlog makes connect() wait for the listener to accept.
    dispatch::ScopedBlockingCall blocking;
    err = connectOnce(fd, path);
    if (err == EINTR) {
      // The connection goes on in the background; wait for its outcome.
      pollfd p{fd, POLLOUT, 0};
      while (::poll(&p, 1, -1) < 0 && errno == EINTR) {
      }
      socklen_t size = sizeof err;
      if (::getsockopt(fd, SOL_SOCKET, SO_ERROR, &err, &size) != 0) err = errno;
    }
  }
  if (err != 0) {
    ::close(fd);
    if (err == ENOENT || err == ECONNREFUSED) {
      return makeError(ErrorCode::ServiceUnavailable, "nobody listens at " + path);
    }
    return socketError(err, "connect", path);
  }
  // Left in blocking mode: every read and write passes MSG_DONTWAIT, except
  // a synchronous request's wait for its reply, which blocks in recv().
  return fd;
}

void removeSocketFile(const std::string& path, dev_t device, ino_t inode) {
  struct stat st {};
  if (::lstat(path.c_str(), &st) == 0 && st.st_dev == device && st.st_ino == inode) {
    ::unlink(path.c_str());
  }
}

}  // namespace platform::mbx::internal
