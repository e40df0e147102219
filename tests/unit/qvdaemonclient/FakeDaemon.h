// A stand-in for qvd in the test process: a listener under the test's
// platform root that records every request and answers it with whatever the
// test configured. It can also sit on replies until told to send them, and
// cut its connections, as a daemon that stalls or exits would.
//
// Thread safety: every member may be called from any thread; requests are
// handled on the fake's own serial queue.
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
  // Makes the reply to a request (by default an empty dictionary).
  using Responder = std::function<platform::Dictionary(const platform::Dictionary& request)>;

  // REQUIRES: a temporary platform root is in place.
  explicit FakeDaemon(const std::string& service);
  ~FakeDaemon();
  FakeDaemon(const FakeDaemon&) = delete;
  FakeDaemon& operator=(const FakeDaemon&) = delete;

  bool listening() const { return listener_ != nullptr; }

  void answerWith(platform::Dictionary reply);
  void answerWith(Responder responder);
  // From now on replies wait for releaseReplies().
  void holdReplies();
  void releaseReplies();
  // Ends every connection accepted so far.
  void dropConnections();

  std::vector<platform::Dictionary> requests() const;
  // Waits until `count` requests have arrived.
  bool waitForRequests(std::size_t count, std::chrono::milliseconds limit = 10s) const;
  // The `count`th request (from 1), once it has arrived; an empty
  // dictionary when it does not within 10 s.
  platform::Dictionary request(std::size_t count) const;

 private:
  struct State;
  const std::shared_ptr<State> state_;
  std::shared_ptr<platform::mbx::Listener> listener_;
};

}  // namespace qvdtest
