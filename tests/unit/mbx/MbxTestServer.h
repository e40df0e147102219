// A listener in the test process that records, per connection, what the
// connection delivered, in order: "seq N" for a message {"seq": N}, "map"
// for another map, "non-map V" for another body, "request" (answered
// {"echo": body} unless onRequest is set), "goodbye", "invalid" and
// "finalized" (the context finalizer ran). It also records "off-queue" or
// "overlap" should an event arrive off the delivery queue or while another
// is being handled.
#pragma once

#include <functional>

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
  std::size_t connectionCount() const;
  std::shared_ptr<Connection> connection(std::size_t i) const { return entry(i).first; }
  std::vector<std::string> events(std::size_t i) const { return entry(i).second->entries(); }
  // Waits until connection i exists and has recorded `event`.
  bool waitFor(std::size_t i, const std::string& event) const;

 private:
  using Entry = std::pair<std::shared_ptr<Connection>, std::shared_ptr<Recorder>>;
  Entry entry(std::size_t i) const;
  void adopt(const std::shared_ptr<Connection>& connection);

  const RequestHandler onRequest_;
  std::shared_ptr<dispatch::SerialQueue> queue_ = dispatch::SerialQueue::create("test.server");
  std::shared_ptr<Listener> listener_;
  mutable std::mutex mu_;
  std::vector<Entry> entries_;
};

// A request from a new connection in this process: whether `service` replied.
bool roundTrip(const std::string& service);

}  // namespace platform::mbx::testing
