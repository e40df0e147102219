// A connected or listening socket's descriptor, closed when the last holder
// lets go. A connection and the cancel handlers of its event sources share
// one, so the descriptor stays open until the reactor no longer watches it.
//
// Thread safety: immutable; share freely.
#pragma once

#include <unistd.h>

namespace platform::mbx::internal {

class SocketHandle {
 public:
  // Takes ownership of `fd`.
  explicit SocketHandle(int fd) : fd_(fd) {}
  ~SocketHandle() {
    // close() frees the descriptor even when it reports EINTR: never retried.
    if (fd_ >= 0) ::close(fd_);
  }
  SocketHandle(const SocketHandle&) = delete;
  SocketHandle& operator=(const SocketHandle&) = delete;

  int fd() const { return fd_; }

 private:
  const int fd_;
};

}  // namespace platform::mbx::internal
