// A stand-in for qvd: records every request and answers as configured; can
// hold replies and cut connections. Thread-safe.
#pragma once

#include <chrono>
#include <functional>
#include <memory>
#include <string>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Listener.h"
#include "platform/values/Value.h"

namespace qvdtest {

using namespace std::chrono_literals;

class FakeDaemon {
 public:
  using Responder = std::function<platform::Dictionary(const platform::Dictionary& request)>;

  // REQUIRES: a temporary platform root is in place.
  explicit FakeDaemon(const std::string& service);
  ~FakeDaemon();
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  bool listening() const { return listener_ != nullptr; }

  void answerWith(platform::Dictionary reply);
  void answerWith(Responder responder);
  void holdReplies();
  void releaseReplies();
  void dropConnections();

  std::vector<platform::Dictionary> requests() const;
  bool waitForRequests(std::size_t count, std::chrono::milliseconds limit = 10s) const;
  // The `count`th request (from 1); empty if it does not arrive within 10 s.
  platform::Dictionary request(std::size_t count) const;

 private:
  struct State;
  const std::shared_ptr<State> state_;
  std::shared_ptr<platform::mbx::Listener> listener_;
};

}  // namespace qvdtest
