#include "tests/load/FrameClient.h"

#include <utility>

#include "platform/mbx/Frame.h"

namespace qvd::load {

using Clock = std::chrono::steady_clock;
using integration::RawSocketClient;

std::optional<FrameClient> FrameClient::connect(const std::string& socketPath) {
  std::optional<RawSocketClient> socket = RawSocketClient::connect(socketPath);
  if (!socket) return std::nullopt;
  return FrameClient(std::move(*socket));
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
  const std::uint64_t id = socket_.sendRequest(body, limit);
  if (id == 0) {
    fault("request " + std::to_string(lastId() + 1) + ": could not be sent");
    return std::nullopt;
  }
  const auto deadline = Clock::now() + limit;
  std::optional<platform::Value> reply;
  while (!reply) {
    const auto left =
        std::chrono::duration_cast<std::chrono::milliseconds>(deadline - Clock::now());
    const Read read = left.count() > 0 ? readOnce(left, id, reply) : Read::Timeout;
    if (read == Read::Timeout) {
      fault("request " + std::to_string(id) + ": no reply within " + std::to_string(limit.count()) +
            " ms");
      return std::nullopt;
    }
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
    if (left.count() <= 0 || readOnce(left, 0, none) != Read::Frame) break;
  }
  return strays_ == before;
}

FrameClient::Read FrameClient::readOnce(std::chrono::milliseconds limit, std::uint64_t waitingFor,
                                        std::optional<platform::Value>& reply) {
  RawSocketClient::Received frame = socket_.receive(limit);
  switch (frame.outcome) {
    case RawSocketClient::Outcome::TimedOut:
      return Read::Timeout;
    case RawSocketClient::Outcome::Closed:
      return Read::Ended;
    case RawSocketClient::Outcome::Unreadable:
      ++strays_;
      fault("broken frame from the daemon");
      return Read::Ended;
    case RawSocketClient::Outcome::Frame:
      break;
  }
  const std::uint64_t to = frame.header.inReplyTo;
  if (frame.header.flags != platform::mbx::kFlagReply) {
    ++strays_;
    fault("unasked frame (flags " + std::to_string(frame.header.flags) + ")");
    return Read::Frame;
  }
  const int count = ++replies_[to];
  if (to == 0 || to > lastId()) {
    ++strays_;
    fault("reply to request " + std::to_string(to) + ", never sent");
  } else if (count > 1) {
    ++strays_;
    fault("reply " + std::to_string(count) + " to request " + std::to_string(to));
  } else if (to != waitingFor) {
    // Each request is waited for before the next, so an earlier id has its
    // reply already: this would be a reply to nobody waiting.
    ++strays_;
    fault("late reply to request " + std::to_string(to));
  } else {
    reply = std::move(frame.body);
  }
  return Read::Frame;
}

}  // namespace qvd::load
