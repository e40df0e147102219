#include "tests/integration/RawSocketClient.h"

#include <errno.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <array>
#include <cstring>
#include <utility>

#include "platform/cbor/Cbor.h"

namespace qvd::integration {

using Clock = std::chrono::steady_clock;
using platform::mbx::kFrameHeaderSize;

namespace {

// Milliseconds left until `deadline`, as poll() takes them (0 once past).
int remainingMs(Clock::time_point deadline) {
  const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
  return left.count() > 0 ? static_cast<int>(left.count()) : 0;
}

// Waits for `events` on `fd`: true when they came before the deadline.
bool waitFor(int fd, short events, Clock::time_point deadline) {
  for (;;) {
    pollfd entry{fd, events, 0};
    const int n = ::poll(&entry, 1, remainingMs(deadline));
    if (n > 0) return true;
    if (n == 0) return false;
    if (errno != EINTR) return false;
  }
}

}  // namespace

std::optional<RawSocketClient> RawSocketClient::connect(const std::string& socketPath) {
  sockaddr_un address{};
  if (socketPath.size() >= sizeof address.sun_path) return std::nullopt;
  address.sun_family = AF_UNIX;
  std::memcpy(address.sun_path, socketPath.c_str(), socketPath.size() + 1);
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  if (fd < 0) return std::nullopt;
  if (::connect(fd, reinterpret_cast<const sockaddr*>(&address), sizeof address) != 0) {
    ::close(fd);
    return std::nullopt;
  }
  return RawSocketClient(fd);
}

RawSocketClient::RawSocketClient(RawSocketClient&& other) noexcept
    : fd_(std::exchange(other.fd_, -1)), lastId_(other.lastId_) {}

RawSocketClient& RawSocketClient::operator=(RawSocketClient&& other) noexcept {
  if (this != &other) {
    if (fd_ >= 0) ::close(fd_);
    fd_ = std::exchange(other.fd_, -1);
    lastId_ = other.lastId_;
  }
  return *this;
}

RawSocketClient::~RawSocketClient() {
  if (fd_ >= 0) ::close(fd_);
}

bool RawSocketClient::send(std::span<const std::uint8_t> bytes, std::chrono::milliseconds limit) {
  const auto deadline = Clock::now() + limit;
  std::size_t sent = 0;
  while (sent < bytes.size()) {
    const ssize_t n =
        ::send(fd_, bytes.data() + sent, bytes.size() - sent, MSG_NOSIGNAL | MSG_DONTWAIT);
    if (n > 0) {
      sent += static_cast<std::size_t>(n);
      continue;
    }
    if (n < 0 && errno == EINTR) continue;
    if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK) && waitFor(fd_, POLLOUT, deadline)) {
      continue;
    }
    return false;
  }
  return true;
}

std::uint64_t RawSocketClient::sendRequest(const platform::Value& body,
                                           std::chrono::milliseconds limit) {
  auto encoded = platform::cbor::encode(body);
  if (!encoded.ok()) return 0;
  const auto length = static_cast<std::uint32_t>(encoded.value().size());
  if (!send(
          rawFrame(header(platform::mbx::kFlagReplyExpected, lastId_ + 1, length), encoded.value()),
          limit)) {
    return 0;
  }
  return ++lastId_;
}

RawSocketClient::Outcome RawSocketClient::readExactly(std::span<std::uint8_t> out,
                                                      Clock::time_point deadline) {
  std::size_t filled = 0;
  while (filled < out.size()) {
    if (!waitFor(fd_, POLLIN, deadline)) return Outcome::TimedOut;
    const ssize_t n = ::recv(fd_, out.data() + filled, out.size() - filled, MSG_DONTWAIT);
    if (n > 0) {
      filled += static_cast<std::size_t>(n);
    } else if (n == 0) {
      return Outcome::Closed;
    } else if (errno != EINTR && errno != EAGAIN && errno != EWOULDBLOCK) {
      return Outcome::Closed;  // a reset is the peer closing too
    }
  }
  return Outcome::Frame;
}

RawSocketClient::Received RawSocketClient::receive(std::chrono::milliseconds limit) {
  const auto deadline = Clock::now() + limit;
  Received received;
  std::array<std::uint8_t, kFrameHeaderSize> head{};
  received.outcome = readExactly(head, deadline);
  if (received.outcome != Outcome::Frame) return received;
  received.header = platform::mbx::readHeader(head);
  if (received.header.magic != platform::mbx::kFrameMagic ||
      received.header.bodyLength > platform::mbx::kMaxBodyBytes) {
    received.outcome = Outcome::Unreadable;
    return received;
  }
  std::vector<std::uint8_t> body(received.header.bodyLength);
  received.outcome = readExactly(body, deadline);
  if (received.outcome != Outcome::Frame || body.empty()) return received;
  // The daemon's replies may hold more items than it accepts in a request.
  platform::cbor::DecodeLimits limits;
  limits.maxItems = 2'097'152;
  auto decoded = platform::cbor::decode(body, limits);
  if (!decoded.ok()) {
    received.outcome = Outcome::Unreadable;
    return received;
  }
  received.body = std::move(decoded).value();
  return received;
}

platform::Value RawSocketClient::call(const platform::Value& body,
                                      std::chrono::milliseconds limit) {
  const std::uint64_t id = sendRequest(body, limit);
  if (id == 0) return platform::Value();
  Received reply = receive(limit);
  if (reply.outcome != Outcome::Frame || reply.header.flags != platform::mbx::kFlagReply ||
      reply.header.inReplyTo != id) {
    return platform::Value();
  }
  return reply.body;
}

bool RawSocketClient::waitUntilClosed(std::chrono::milliseconds limit) {
  const auto deadline = Clock::now() + limit;
  std::vector<std::uint8_t> sink(256 * 1024);
  for (;;) {
    if (!waitFor(fd_, POLLIN, deadline)) return false;
    const ssize_t n = ::recv(fd_, sink.data(), sink.size(), MSG_DONTWAIT);
    if (n == 0) return true;
    if (n < 0 && errno != EINTR && errno != EAGAIN && errno != EWOULDBLOCK) return true;
  }
}

void RawSocketClient::shutdownWrite() {
  ::shutdown(fd_, SHUT_WR);
}

pid_t RawSocketClient::peerPid() const {
  ucred credentials{};
  socklen_t length = sizeof credentials;
  if (::getsockopt(fd_, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) return -1;
  return credentials.pid;
}

}  // namespace qvd::integration
