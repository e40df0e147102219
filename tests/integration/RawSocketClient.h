// A client that speaks the daemon's wire format by hand, with none of the
// message library's care: it can send what no well-behaved client would
// (broken headers, undecodable bodies, partial frames) and leave replies
// unread. Every wait is bounded, so a daemon that misbehaves fails a test
// instead of hanging it.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <optional>
#include <span>
#include <string>
#include <vector>

#include "platform/mbx/Frame.h"
#include "platform/values/Value.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace qvd::integration {

// Frame bytes by hand: the message system's test helpers, shared.
using platform::mbx::testing::cborOf;
using platform::mbx::testing::header;
using platform::mbx::testing::rawFrame;

class RawSocketClient {
 public:
  // Connects to the Unix socket at `socketPath`; none when that fails.
  static std::optional<RawSocketClient> connect(const std::string& socketPath);

  RawSocketClient(RawSocketClient&& other) noexcept;
  RawSocketClient& operator=(RawSocketClient&& other) noexcept;
  RawSocketClient(const RawSocketClient&) = delete;
  RawSocketClient& operator=(const RawSocketClient&) = delete;
  ~RawSocketClient();

  // Writes all of `bytes`; false when the socket failed or stayed full past
  // `limit`.
  bool send(std::span<const std::uint8_t> bytes, std::chrono::milliseconds limit);
  // Sends `body` as a request (reply expected) under the next message id,
  // which it answers; 0 when the body could not be sent.
  std::uint64_t sendRequest(const platform::Value& body,
                            std::chrono::milliseconds limit = std::chrono::seconds(5));

  enum class Outcome { Frame, Closed, TimedOut, Unreadable };
  struct Received {
    Outcome outcome = Outcome::TimedOut;
    platform::mbx::FrameHeader header;
    platform::Value body;
  };
  // The next frame from the peer, its body decoded (Unreadable when the
  // header or body is not what the daemon may send).
  Received receive(std::chrono::milliseconds limit);
  // Sends `body` as a request and reads the frame that follows: the reply's
  // body when it answers that request, none otherwise.
  platform::Value call(const platform::Value& body,
                       std::chrono::milliseconds limit = std::chrono::seconds(10));

  // Reads and drops whatever arrives until the peer closes the connection:
  // true when it did within `limit`.
  bool waitUntilClosed(std::chrono::milliseconds limit);

  // Ends this side's writing: the peer reads end-of-stream.
  void shutdownWrite();
  // The pid of the process at the other end, from the socket's credentials.
  pid_t peerPid() const;
  std::uint64_t lastMessageId() const { return lastId_; }

 private:
  explicit RawSocketClient(int fd) : fd_(fd) {}
  // Reads exactly `out.size()` bytes; Frame when done.
  Outcome readExactly(std::span<std::uint8_t> out, std::chrono::steady_clock::time_point deadline);

  int fd_ = -1;
  std::uint64_t lastId_ = 0;
};

}  // namespace qvd::integration
