// A file descriptor with a single owner: closed when the owner goes away.
//
// Thread safety: like any value; a const UniqueFd may be read from any thread.
#pragma once

#include <unistd.h>

#include <utility>

namespace platform::mbx::internal {

class UniqueFd {
 public:
  UniqueFd() = default;
  // Takes ownership of `fd` (-1 for none).
  explicit UniqueFd(int fd) : fd_(fd) {}
  UniqueFd(UniqueFd&& other) noexcept : fd_(std::exchange(other.fd_, -1)) {}
  UniqueFd& operator=(UniqueFd&& other) noexcept {
    if (this != &other) reset(std::exchange(other.fd_, -1));
    return *this;
  }
  UniqueFd(const UniqueFd&) = delete;
  UniqueFd& operator=(const UniqueFd&) = delete;
  ~UniqueFd() { reset(); }

  int get() const { return fd_; }
  bool valid() const { return fd_ >= 0; }

  // Closes the descriptor held, if any, and holds `fd` instead.
  void reset(int fd = -1) {
    // close() releases the descriptor even when it reports EINTR on Linux, so
    // it is never retried.
    if (fd_ >= 0) ::close(fd_);
    fd_ = fd;
  }

 private:
  int fd_ = -1;
};

}  // namespace platform::mbx::internal
