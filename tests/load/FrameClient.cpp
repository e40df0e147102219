#include "tests/load/FrameClient.h"

#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <span>
#include <utility>
#include <vector>

#include "platform/mbx/Frame.h"

namespace qvd::load {

using Clock = std::chrono::steady_clock;
using platform::mbx::FrameKind;

std::optional<FrameClient> FrameClient::connect(const std::string& socketPath) {
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return std::nullopt;
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  if (::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
    ::close(fd);
    return std::nullopt;
  }
  return FrameClient(fd);
}

FrameClient::FrameClient(int fd)
    : fd_(fd), reader_(std::make_unique<platform::mbx::FrameReader>()), buffer_(64 * 1024) {}

FrameClient::FrameClient(FrameClient&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)),
      lastId_(other.lastId_),
      replies_(std::move(other.replies_)),
      reader_(std::move(other.reader_)),
      problem_(std::move(other.problem_)),
      strays_(other.strays_),
      buffer_(std::move(other.buffer_)) {}

FrameClient::~FrameClient() {
  if (fd_ >= 0) ::close(fd_);
}

int FrameClient::repliesTo(std::uint64_t id) const {
  const auto found = replies_.find(id);
  return found == replies_.end() ? 0 : found->second;
}

void FrameClient::fault(const std::string& what) {
  if (problem_.empty()) problem_ = what;
}

std::optional<platform::Value> FrameClient::request(const platform::Value& body,
                                                    std::chrono::milliseconds limit) {
  auto frame = platform::mbx::encodeFrame(FrameKind::Request, 0, body);
  if (!frame.ok()) {
    fault("cannot encode a request: " + frame.error().description());
    return std::nullopt;
  }
  const std::uint64_t id = ++lastId_;
  platform::mbx::setMessageId(*frame, id);
  for (std::size_t sent = 0; sent < frame->size();) {
    const ssize_t n = ::send(fd_, frame->data() + sent, frame->size() - sent, MSG_NOSIGNAL);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) {
      fault("request " + std::to_string(id) + ": send failed: " + std::strerror(errno));
      return std::nullopt;
    }
    sent += static_cast<std::size_t>(n);
  }
  const auto deadline = Clock::now() + limit;
  std::optional<platform::Value> reply;
  while (!reply) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    if (left.count() <= 0) {
      fault("request " + std::to_string(id) + ": no reply within " + std::to_string(limit.count()) +
            " ms");
      return std::nullopt;
    }
    const Read read = readOnce(left, id, reply);
    if (read == Read::Ended && !reply) {
      fault("request " + std::to_string(id) + ": connection ended without a reply");
      return std::nullopt;
    }
  }
  return reply;
}

bool FrameClient::expectSilence(std::chrono::milliseconds quiet) {
  const int before = strays_;
  const auto deadline = Clock::now() + quiet;
  std::optional<platform::Value> none;
  for (;;) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    if (left.count() <= 0 || readOnce(left, 0, none) != Read::Frames) break;
  }
  return strays_ == before;
}

FrameClient::Read FrameClient::readOnce(std::chrono::milliseconds limit, std::uint64_t waitingFor,
                                        std::optional<platform::Value>& reply) {
  pollfd watched{fd_, POLLIN, 0};
  const int ready = ::poll(&watched, 1, static_cast<int>(limit.count()));
  if (ready == 0) return Read::Timeout;
  if (ready < 0) return errno == EINTR ? Read::Frames : Read::Ended;
  const ssize_t n = ::recv(fd_, buffer_.data(), buffer_.size(), MSG_DONTWAIT);
  if (n < 0 && (errno == EAGAIN || errno == EINTR)) return Read::Frames;
  if (n <= 0) return Read::Ended;
  std::span<const std::uint8_t> input(buffer_.data(), static_cast<std::size_t>(n));
  while (!input.empty()) {
    auto step = reader_->next(input);
    if (!step.ok()) {
      ++strays_;
      fault("broken frame from the daemon: " + step.error().description());
      return Read::Ended;
    }
    if (!step->has_value()) break;
    platform::mbx::Frame& frame = **step;
    if (frame.kind != FrameKind::Reply) {
      ++strays_;
      fault(std::string("unasked ") + platform::mbx::frameKindName(frame.kind) + " frame");
      continue;
    }
    const int count = ++replies_[frame.inReplyTo];
    if (frame.inReplyTo == 0 || frame.inReplyTo > lastId_) {
      ++strays_;
      fault("reply to request " + std::to_string(frame.inReplyTo) + ", never sent");
    } else if (count > 1) {
      ++strays_;
      fault("reply " + std::to_string(count) + " to request " + std::to_string(frame.inReplyTo));
    } else if (frame.inReplyTo != waitingFor) {
      // Each request is waited for before the next, so an earlier id has
      // its reply already: this would be a reply to nobody waiting.
      ++strays_;
      fault("late reply to request " + std::to_string(frame.inReplyTo));
    } else {
      reply = std::move(frame.body);
    }
  }
  return Read::Frames;
}

}  // namespace qvd::load
