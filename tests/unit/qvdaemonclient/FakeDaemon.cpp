#include "tests/unit/qvdaemonclient/FakeDaemon.h"

#include <mutex>

#include "platform/mbx/Reply.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace qvdtest {

using platform::Dictionary;
using platform::mbx::Connection;
using platform::mbx::ConnectionEvent;
using platform::mbx::Listener;
using platform::mbx::Message;
using platform::mbx::Reply;

// Shared with the handlers, which may run after the fake is gone.
struct FakeDaemon::State {
  mutable std::mutex mu;
  std::vector<Dictionary> requests;
  Responder responder = [](const Dictionary&) { return Dictionary{}; };
  bool holding = false;
  std::vector<Reply> held;
  std::vector<std::shared_ptr<Connection>> connections;

  void handle(const Message& message) {
    if (!message.expectsReply()) return;
    const Dictionary request =
        message.dictionary() != nullptr ? *message.dictionary() : Dictionary{};
    Reply reply = Reply::createReply(message);
    std::unique_lock<std::mutex> lock(mu);
    requests.push_back(request);
    reply.body() = responder(request);
    if (holding) {
      held.push_back(std::move(reply));
      return;
    }
    lock.unlock();
    (void)reply.send();
  }
};

FakeDaemon::FakeDaemon(const std::string& service) : state_(std::make_shared<State>()) {
  auto queue = platform::dispatch::SerialQueue::create("fake.qvd");
  auto listener = Listener::create(service, queue);
  if (!listener.ok()) return;
  listener_ = listener.value();
  listener_->setEventHandler([state = state_](const Listener::Event& event) {
    const auto* accepted = std::get_if<std::shared_ptr<Connection>>(&event);
    if (accepted == nullptr) return;
    std::shared_ptr<Connection> connection = *accepted;
    connection->setEventHandler([state](const ConnectionEvent& connectionEvent) {
      if (const auto* message = std::get_if<Message>(&connectionEvent)) state->handle(*message);
    });
    {
      std::lock_guard<std::mutex> lock(state->mu);
      state->connections.push_back(connection);
    }
    connection->resume();
  });
  listener_->resume();
}

FakeDaemon::~FakeDaemon() {
  if (listener_) listener_->cancel();
  releaseReplies();
  dropConnections();
}

void FakeDaemon::answerWith(Dictionary reply) {
  answerWith([reply](const Dictionary&) { return reply; });
}

void FakeDaemon::answerWith(Responder responder) {
  std::lock_guard<std::mutex> lock(state_->mu);
  state_->responder = std::move(responder);
}

void FakeDaemon::holdReplies() {
  std::lock_guard<std::mutex> lock(state_->mu);
  state_->holding = true;
}

void FakeDaemon::releaseReplies() {
  std::vector<Reply> held;
  {
    std::lock_guard<std::mutex> lock(state_->mu);
    state_->holding = false;
    held.swap(state_->held);
  }
  for (Reply& reply : held) (void)reply.send();
}

void FakeDaemon::dropConnections() {
  std::vector<std::shared_ptr<Connection>> connections;
  {
    std::lock_guard<std::mutex> lock(state_->mu);
    connections.swap(state_->connections);
  }
  for (auto& connection : connections) connection->cancel();
}

std::vector<Dictionary> FakeDaemon::requests() const {
  std::lock_guard<std::mutex> lock(state_->mu);
  return state_->requests;
}

bool FakeDaemon::waitForRequests(std::size_t count, std::chrono::milliseconds limit) const {
  return platform::mbx::testing::eventually([&] { return requests().size() >= count; }, limit);
}

Dictionary FakeDaemon::request(std::size_t count) const {
  if (!waitForRequests(count)) return Dictionary{};
  return requests().at(count - 1);
}

}  // namespace qvdtest
