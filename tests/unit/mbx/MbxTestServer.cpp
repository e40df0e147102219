#include "tests/unit/mbx/MbxTestServer.h"

#include <atomic>

#include "platform/mbx/Reply.h"

namespace platform::mbx::testing {

TestServer::TestServer(const std::string& service, ConnectionLimits limits,
                       RequestHandler onRequest)
    : onRequest_(std::move(onRequest)) {
  auto listener = Listener::create(service, queue_, limits);
  if (!listener.ok()) return;
  listener_ = listener.value();
  listener_->setEventHandler([this](const Listener::Event& event) {
    if (const auto* connection = std::get_if<std::shared_ptr<Connection>>(&event))
      adopt(*connection);
  });
  listener_->resume();
}

TestServer::~TestServer() {
  if (listener_) listener_->cancel();
  std::vector<Entry> entries;
  {
    std::lock_guard lock(mu_);
    entries = entries_;
  }
  for (Entry& entry : entries) entry.first->cancel();
  // Handlers refer to this object: wait until every connection has finished.
  for (Entry& entry : entries) eventually([&] { return entry.second->count("finalized") > 0; });
  if (listener_) queue_->sync([] {});
}

void TestServer::adopt(const std::shared_ptr<Connection>& connection) {
  auto recorder = std::make_shared<Recorder>();
  std::weak_ptr<Connection> weak = connection;
  connection->setEventHandler([this, weak, recorder, busy = std::make_shared<std::atomic<int>>(0)](
                                  const ConnectionEvent& event) {
    auto self = weak.lock();
    if (busy->fetch_add(1) != 0) recorder->add("overlap");
    if (self && !self->deliveryQueue()->isCurrent()) recorder->add("off-queue");
    const Message* message = std::get_if<Message>(&event);
    if (message == nullptr) {
      recorder->add(std::get<ConnectionError>(event) == ConnectionError::Invalid ? "invalid"
                                                                                 : "goodbye");
    } else if (message->expectsReply()) {
      recorder->add("request");
      if (onRequest_) {
        onRequest_(self, *message);
      } else {
        Reply reply = Reply::createReply(*message);
        reply.body().set("echo", message->body());
        (void)reply.send();
      }
    } else if (const Dictionary* body = message->dictionary()) {
      const Value* seq = body->find("seq");
      recorder->add(seq != nullptr ? "seq " + seq->description() : "map");
    } else {
      recorder->add("non-map " + message->body().description());
    }
    busy->fetch_sub(1);
  });
  connection->setContext(recorder, [](std::shared_ptr<void> context) {
    static_cast<Recorder*>(context.get())->add("finalized");
  });
  {
    std::lock_guard lock(mu_);
    entries_.emplace_back(connection, recorder);
  }
  connection->resume();
}

std::size_t TestServer::connectionCount() const {
  std::lock_guard lock(mu_);
  return entries_.size();
}

TestServer::Entry TestServer::entry(std::size_t i) const {
  std::lock_guard lock(mu_);
  return entries_.at(i);
}

bool TestServer::waitFor(std::size_t i, const std::string& event) const {
  return eventually([&] { return i < connectionCount() && entry(i).second->count(event) > 0; });
}

bool roundTrip(const std::string& service) {
  auto connection = Connection::connectToService(service);
  if (!connection.ok()) return false;
  connection.value()->setEventHandler([](const ConnectionEvent&) {});
  connection.value()->resume();
  auto reply = connection.value()->sendWithReplySync(Dictionary{{"ping", 1}});
  connection.value()->cancel();
  return reply.ok() && reply.value().isReply();
}

}  // namespace platform::mbx::testing
