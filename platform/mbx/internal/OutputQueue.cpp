#include "platform/mbx/internal/OutputQueue.h"

#include <sys/socket.h>
#include <sys/uio.h>

#include <algorithm>
#include <cassert>
#include <cerrno>

namespace platform::mbx::internal {

void OutputQueue::append(std::vector<std::uint8_t> frame, std::size_t alreadyWritten) {
  assert(alreadyWritten < frame.size());
  if (empty()) headOffset_ = alreadyWritten;
  bytes_ += frame.size() - alreadyWritten;
  frames_.push_back(std::move(frame));
}

OutputQueue::Flush OutputQueue::flushTo(int fd, int* error) {
  while (!empty()) {
    iovec iov[kMaxBatch];
    int count = 0;
    for (std::size_t i = head_; i < frames_.size() && count < kMaxBatch; ++i, ++count) {
      const std::size_t skip = i == head_ ? headOffset_ : 0;
      iov[count].iov_base = frames_[i].data() + skip;
      iov[count].iov_len = frames_[i].size() - skip;
    }
    msghdr message{};
    message.msg_iov = iov;
    message.msg_iovlen = static_cast<std::size_t>(count);
    // MSG_NOSIGNAL: a peer that went away is an error value, not a SIGPIPE.
    ssize_t written = ::sendmsg(fd, &message, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (written < 0) {
      if (errno == EINTR) continue;
      if (errno == EAGAIN || errno == EWOULDBLOCK) return Flush::WouldBlock;
      *error = errno;
      return Flush::Failed;
    }
    dropWritten(static_cast<std::size_t>(written));
  }
  return Flush::Drained;
}

void OutputQueue::dropWritten(std::size_t written) {
  bytes_ -= written;
  while (written > 0) {
    const std::size_t left = frames_[head_].size() - headOffset_;
    if (written < left) {
      headOffset_ += written;
      return;
    }
    written -= left;
    frames_[head_] = std::vector<std::uint8_t>();  // free the frame as soon as it is out
    ++head_;
    headOffset_ = 0;
  }
  if (head_ == frames_.size()) {
    clear();
  } else if (head_ >= 2 * kMaxBatch) {
    frames_.erase(frames_.begin(), frames_.begin() + static_cast<std::ptrdiff_t>(head_));
    head_ = 0;
  }
}

void OutputQueue::clear() {
  // An empty queue holds no memory, so idle connections cost nothing here.
  frames_ = std::vector<std::vector<std::uint8_t>>();
  head_ = 0;
  headOffset_ = 0;
  bytes_ = 0;
}

}  // namespace platform::mbx::internal
