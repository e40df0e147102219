// A client that speaks the daemon's wire format itself (through the
// integration tests' RawSocketClient), one frame at a time, so that it sees
// every frame the daemon sends: the message system's own
// connection drops a reply nobody waits for, which would hide a second
// reply to the same request. It numbers its requests itself and counts the
// replies each id got.
//
// Thread safety: none; one client belongs to one process of the load test.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <optional>
#include <string>
#include <utility>

#include "platform/values/Value.h"
#include "tests/integration/RawSocketClient.h"

namespace qvd::load {

class FrameClient {
 public:
  // Connects to the Unix socket at `socketPath`; none when that fails.
  static std::optional<FrameClient> connect(const std::string& socketPath);
  FrameClient(FrameClient&&) noexcept = default;
  FrameClient& operator=(FrameClient&&) = delete;

  // Sends `body` as a request with the next id and reads until its reply
  // comes, `limit` passes or the connection ends. Any other frame read
  // meanwhile is a fault (a second reply, a reply to an id never sent, a
  // message that is no reply); faults are kept in problem().
  std::optional<platform::Value> request(const platform::Value& body,
                                         std::chrono::milliseconds limit);
  // Reads whatever arrives within `quiet`: after the last reply nothing
  // may come. False (and a problem) when something did.
  bool expectSilence(std::chrono::milliseconds quiet);

  // How many replies the request with `id` got.
  int repliesTo(std::uint64_t id) const;
  std::uint64_t lastId() const { return socket_.lastMessageId(); }
  // The first fault seen, or "".
  const std::string& problem() const { return problem_; }
  // Faults other than a missing reply: extra, unknown or unasked frames.
  int strayFrames() const { return strays_; }

 private:
  explicit FrameClient(integration::RawSocketClient socket) : socket_(std::move(socket)) {}
  // Reads one frame (waiting at most `limit`) and files it; `waitingFor` is
  // the id whose reply ends the wait (0: none). Answers that reply's body
  // once it is taken.
  enum class Read { Frame, Timeout, Ended };
  Read readOnce(std::chrono::milliseconds limit, std::uint64_t waitingFor,
                std::optional<platform::Value>& reply);
  void fault(const std::string& what);

  integration::RawSocketClient socket_;
  std::map<std::uint64_t, int> replies_;
  std::string problem_;
  int strays_ = 0;
};

}  // namespace qvd::load
