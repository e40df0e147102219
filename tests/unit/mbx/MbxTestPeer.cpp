// The other process of the two-process tests: a fresh program (started with
// posix_spawn, so it inherits none of the test's threads) that uses the
// message library as a daemon or a client would. QV_ROOT comes from the
// environment. It leaves with _exit: live connections and dispatch threads
// end with the process, as a crashing client's would.
//
//   mbx_test_peer serve SERVICE             echo server, runs until stdin closes
//   mbx_test_peer burst SERVICE N           sends {"seq": i} for i < N, the request
//                                           {"op": "flush"}, a goodbye, and exits
//   mbx_test_peer request-and-exit SERVICE  sends one request and exits without waiting
//
// The echo server answers every request with {"echo": <body>, "pid": <pid>}.
// A body {"op": "exit"} makes it exit at once; {"op": "goodbye"} makes it say
// goodbye on that connection and close it; {"op": "ignore"} is never
// answered; {"op": "notify", "count": N} first sends N messages {"seq": i}.
#include <unistd.h>

#include <string>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/Listener.h"
#include "platform/mbx/Reply.h"

using namespace platform;

namespace {

void handleRequest(const std::shared_ptr<mbx::Connection>& connection, const mbx::Message& m) {
  const Dictionary* body = m.dictionary();
  const Value* opValue = body != nullptr ? body->find("op") : nullptr;
  const std::string op = opValue != nullptr && opValue->string() ? *opValue->string() : "";
  if (op == "exit") ::_exit(0);
  if (op == "goodbye") {
    connection->sendGoodbye();
    connection->cancel();
  }
  if (op == "goodbye" || op == "ignore" || !m.expectsReply()) return;
  for (std::int64_t i = 0; op == "notify" && i < body->get("count").int64().value_or(0); ++i)
    connection->send(Dictionary{{"seq", Value(i)}});
  auto reply = mbx::Reply::createReply(m);
  reply.body().set("echo", m.body());
  reply.body().set("pid", static_cast<long long>(::getpid()));
  (void)reply.send();
}

int serve(const std::string& service) {
  auto listener = mbx::Listener::create(service, dispatch::SerialQueue::create("peer.listener"));
  if (!listener.ok()) return 2;
  listener.value()->setEventHandler([](const mbx::Listener::Event& event) {
    const auto* connection = std::get_if<std::shared_ptr<mbx::Connection>>(&event);
    if (connection == nullptr) return;
    std::weak_ptr<mbx::Connection> weak = *connection;
    (*connection)->setEventHandler([weak](const mbx::ConnectionEvent& e) {
      auto self = weak.lock();
      if (const auto* message = std::get_if<mbx::Message>(&e); self && message)
        handleRequest(self, *message);
    });
    (*connection)->resume();
  });
  listener.value()->resume();
  char buffer[64];
  while (::read(0, buffer, sizeof buffer) > 0) {
  }
  return 0;
}

int run(int argc, char** argv) {
  if (argc < 3) return 64;
  const std::string mode = argv[1];
  if (mode == "serve") return serve(argv[2]);
  auto connection = mbx::Connection::connectToService(argv[2]);
  if (!connection.ok()) return 2;
  connection.value()->setEventHandler([](const mbx::ConnectionEvent&) {});
  connection.value()->resume();
  if (mode == "request-and-exit") {
    connection.value()->sendWithReply(Dictionary{{"op", "slow"}}, nullptr,
                                      [](Result<mbx::Message>) {});
    return 0;
  }
  if (mode != "burst" || argc < 4) return 64;
  for (long i = 0; i < std::stol(argv[3]); ++i)
    connection.value()->send(Dictionary{{"seq", Value(i)}});
  // Once the server has answered a request sent after them, it has read them all.
  if (!connection.value()->sendWithReplySync(Dictionary{{"op", "flush"}}).ok()) return 3;
  connection.value()->sendGoodbye();
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  ::_exit(run(argc, argv));
}
