// A listener in the test process that records, per connection, what the
// connection delivered, in order, as short text:
//   "seq N"       a message {"seq": N}
//   "map"         another message whose body is a map
//   "non-map V"   a message whose body is not a map (V its description)
//   "request"     a request (answered {"echo": body} unless onRequest is set)
//   "goodbye"     TerminationImminent
//   "invalid"     Invalid
//   "finalized"   the context finalizer ran
// It also records "off-queue" or "overlap" should an event ever arrive off
// the connection's delivery queue or while another is being handled.
#pragma once

#include <atomic>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/Listener.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace platform::mbx::testing {

class TestServer {
 public:
  using RequestHandler = std::function<void(const std::shared_ptr<Connection>&, const Message&)>;

  // REQUIRES: a TemporaryRoot is in place.
  explicit TestServer(const std::string& service, ConnectionLimits limits = {},
                      RequestHandler onRequest = nullptr);
  ~TestServer();

  bool listening() const { return listener_ != nullptr; }
  const std::string& service() const { return service_; }

  std::size_t connectionCount() const;
  // REQUIRES: i < connectionCount().
  std::shared_ptr<Connection> connection(std::size_t i) const;
  std::vector<std::string> events(std::size_t i) const;
  // Waits until connection i exists and has recorded `entry`.
  bool waitFor(std::size_t i, const std::string& entry, std::chrono::milliseconds limit = 10s) const;

 private:
  struct Entry {
    std::shared_ptr<Connection> connection;
    std::shared_ptr<Recorder> recorder;
    std::shared_ptr<std::atomic<int>> busy;
  };
  void adopt(const std::shared_ptr<Connection>& connection);

  const std::string service_;
  const RequestHandler onRequest_;
  std::shared_ptr<dispatch::SerialQueue> queue_;
  std::shared_ptr<Listener> listener_;
  mutable std::mutex mu_;
  std::vector<Entry> entries_;
};

// A request from a new connection in this process: answers whether `service`
// replied.
bool roundTrip(const std::string& service);

}  // namespace platform::mbx::testing
