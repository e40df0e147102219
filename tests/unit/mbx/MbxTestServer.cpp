#include "tests/unit/mbx/MbxTestServer.h"

#include "platform/mbx/Reply.h"

namespace platform::mbx::testing {

TestServer::TestServer(const std::string& service, ConnectionLimits limits,
                       RequestHandler onRequest)
    : service_(service),
      onRequest_(std::move(onRequest)),
      queue_(dispatch::SerialQueue::create("test.server")) {
  auto listener = Listener::create(service, queue_, limits);
  if (!listener.ok()) return;
  listener_ = listener.value();
  listener_->setEventHandler([this](const Listener::Event& event) {
    if (const auto* connection = std::get_if<std::shared_ptr<Connection>>(&event)) {
      adopt(*connection);
    }
  });
  listener_->resume();
}

TestServer::~TestServer() {
  if (listener_) listener_->cancel();
  std::vector<Entry> entries;
  {
    std::lock_guard<std::mutex> lock(mu_);
    entries = entries_;
  }
  for (Entry& entry : entries) entry.connection->cancel();
  // Handlers refer to this object: wait until every connection has finished.
  for (Entry& entry : entries) {
    eventually([&] { return entry.recorder->count("finalized") > 0; });
  }
  if (listener_) queue_->sync([] {});
}

void TestServer::adopt(const std::shared_ptr<Connection>& connection) {
  Entry entry{connection, std::make_shared<Recorder>(), std::make_shared<std::atomic<int>>(0)};
  std::weak_ptr<Connection> weak = connection;
  connection->setEventHandler([this, weak, recorder = entry.recorder,
                               busy = entry.busy](const ConnectionEvent& event) {
    auto self = weak.lock();
    if (busy->fetch_add(1) != 0) recorder->add("overlap");
    if (self && !self->deliveryQueue()->isCurrent()) recorder->add("off-queue");
    if (const auto* error = std::get_if<ConnectionError>(&event)) {
      recorder->add(*error == ConnectionError::Invalid ? "invalid" : "goodbye");
    } else {
      const Message& message = std::get<Message>(event);
      if (message.expectsReply()) {
        recorder->add("request");
        if (onRequest_) {
          onRequest_(self, message);
        } else {
          Reply reply = Reply::createReply(message);
          reply.body().set("echo", message.body());
          reply.send();
        }
      } else if (const Dictionary* body = message.dictionary()) {
        const Value* seq = body->find("seq");
        recorder->add(seq != nullptr ? "seq " + seq->description() : "map");
      } else {
        recorder->add("non-map " + message.body().description());
      }
    }
    busy->fetch_sub(1);
  });
  connection->setContext(entry.recorder, [](std::shared_ptr<void> context) {
    static_cast<Recorder*>(context.get())->add("finalized");
  });
  {
    std::lock_guard<std::mutex> lock(mu_);
    entries_.push_back(entry);
  }
  connection->resume();
}

std::size_t TestServer::connectionCount() const {
  std::lock_guard<std::mutex> lock(mu_);
  return entries_.size();
}

std::shared_ptr<Connection> TestServer::connection(std::size_t i) const {
  std::lock_guard<std::mutex> lock(mu_);
  return entries_.at(i).connection;
}

std::vector<std::string> TestServer::events(std::size_t i) const {
  std::lock_guard<std::mutex> lock(mu_);
  return entries_.at(i).recorder->entries();
}

bool TestServer::waitFor(std::size_t i, const std::string& entry,
                         std::chrono::milliseconds limit) const {
  return eventually(
      [&] {
        std::lock_guard<std::mutex> lock(mu_);
        return i < entries_.size() && entries_[i].recorder->count(entry) > 0;
      },
      limit);
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
