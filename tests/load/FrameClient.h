// A client that speaks the daemon's wire format itself, one frame at a time,
// so that it sees every frame the daemon sends: the message system's own
// connection drops a reply nobody waits for, which would hide a second
// reply to the same request. It numbers its requests itself and counts the
// replies each id got.
//
// Thread safety: none; one client belongs to one process of the load test.
#pragma once

#include <chrono>
#include <cstdint>
#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "platform/mbx/FrameReader.h"
#include "platform/values/Value.h"

namespace qvd::load {

class FrameClient {
 public:
  // Connects to the Unix socket at `socketPath`; none when that fails.
  static std::optional<FrameClient> connect(const std::string& socketPath);
  FrameClient(FrameClient&& other) noexcept;
  FrameClient& operator=(FrameClient&&) = delete;
  ~FrameClient();

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
  std::uint64_t lastId() const { return lastId_; }
  // The first fault seen, or "".
  const std::string& problem() const { return problem_; }
  // Faults other than a missing reply: extra, unknown or unasked frames.
  int strayFrames() const { return strays_; }

 private:
  explicit FrameClient(int fd);
  // Reads one chunk (waiting at most `limit`) and takes the frames it
  // completes; `waitingFor` is the id whose reply ends the wait (0: none).
  // Answers that reply's body once it is taken.
  enum class Read { Frames, Timeout, Ended };
  Read readOnce(std::chrono::milliseconds limit, std::uint64_t waitingFor,
                std::optional<platform::Value>& reply);
  void fault(const std::string& what);

  int fd_ = -1;
  std::uint64_t lastId_ = 0;
  std::map<std::uint64_t, int> replies_;
  std::unique_ptr<platform::mbx::FrameReader> reader_;
  std::string problem_;
  int strays_ = 0;
  std::vector<std::uint8_t> buffer_;
};

}  // namespace qvd::load
