// The other process of the two-process tests: a fresh program (started with
// posix_spawn, so it inherits none of the test's threads) that uses the
// message library as a daemon or a client would. QV_ROOT comes from the
// environment.
//
//   mbx_test_peer serve SERVICE            echo server; prints "ready", runs until stdin closes
//   mbx_test_peer burst SERVICE N [goodbye] sends {"seq": i} for i < N, then the request
//                                          {"op": "flush"}, then [a goodbye], and exits
//   mbx_test_peer request-and-exit SERVICE  sends one request and exits without waiting
//
// The echo server answers every request with {"echo": <body>, "pid": <pid>}.
// A body {"op": "exit"} makes it exit at once without answering; {"op":
// "goodbye"} makes it say goodbye on that connection, then close it; {"op":
// "ignore"} is never answered; {"op": "notify", "count": N} first sends the
// client N messages {"seq": i}, then answers.
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <string>
#include <string_view>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/Listener.h"
#include "platform/mbx/Reply.h"

using namespace platform;

namespace {

void waitForStdinToClose() {
  char buffer[64];
  while (::read(0, buffer, sizeof buffer) > 0) {
  }
}

void handleRequest(const std::shared_ptr<mbx::Connection>& connection, const mbx::Message& m) {
  const Dictionary* body = m.dictionary();
  const Value* op = body != nullptr ? body->find("op") : nullptr;
  if (op != nullptr && op->string() != nullptr) {
    if (*op->string() == "exit") ::_exit(0);
    if (*op->string() == "goodbye") {
      connection->sendGoodbye();
      connection->cancel();
      return;
    }
    if (*op->string() == "ignore") return;
    if (*op->string() == "notify") {
      const std::int64_t count = body->get("count").int64().value_or(0);
      for (std::int64_t i = 0; i < count; ++i) connection->send(Dictionary{{"seq", Value(i)}});
    }
  }
  if (!m.expectsReply()) return;
  auto reply = mbx::Reply::createReply(m);
  reply.body().set("echo", m.body());
  reply.body().set("pid", static_cast<long long>(::getpid()));
  reply.send();
}

int serve(std::string_view service) {
  auto queue = dispatch::SerialQueue::create("peer.listener");
  auto listener = mbx::Listener::create(service, queue);
  if (!listener.ok()) {
    std::fprintf(stderr, "listen: %s\n", listener.error().description().c_str());
    return 2;
  }
  listener.value()->setEventHandler([](const mbx::Listener::Event& event) {
    const auto* connection = std::get_if<std::shared_ptr<mbx::Connection>>(&event);
    if (connection == nullptr) return;
    std::weak_ptr<mbx::Connection> weak = *connection;
    (*connection)->setEventHandler([weak](const mbx::ConnectionEvent& e) {
      auto self = weak.lock();
      if (self == nullptr) return;
      if (const auto* message = std::get_if<mbx::Message>(&e)) handleRequest(self, *message);
    });
    (*connection)->resume();
  });
  listener.value()->resume();
  std::printf("ready\n");
  std::fflush(stdout);
  waitForStdinToClose();
  return 0;
}

std::shared_ptr<mbx::Connection> connectOrDie(std::string_view service) {
  auto connection = mbx::Connection::connectToService(service);
  if (!connection.ok()) {
    std::fprintf(stderr, "connect: %s\n", connection.error().description().c_str());
    std::exit(2);
  }
  connection.value()->setEventHandler([](const mbx::ConnectionEvent&) {});
  connection.value()->resume();
  return connection.value();
}

int burst(std::string_view service, long count, bool goodbye) {
  auto connection = connectOrDie(service);
  for (long i = 0; i < count; ++i) connection->send(Dictionary{{"seq", Value(i)}});
  // Messages may still sit in the output queue; once the server has answered
  // a request sent after them, it has read them all.
  auto flushed = connection->sendWithReplySync(Dictionary{{"op", "flush"}});
  if (!flushed.ok()) return 3;
  if (goodbye) connection->sendGoodbye();
  return 0;
}

int requestAndExit(std::string_view service) {
  auto connection = connectOrDie(service);
  connection->sendWithReply(Dictionary{{"op", "slow"}}, nullptr, [](Result<mbx::Message>) {});
  ::_exit(0);
}

int run(int argc, char** argv) {
  if (argc < 3) return 64;
  const std::string_view mode = argv[1];
  const std::string_view service = argv[2];
  if (mode == "serve") return serve(service);
  if (mode == "burst" && argc >= 4) {
    return burst(service, std::strtol(argv[3], nullptr, 10),
                 argc >= 5 && std::string_view(argv[4]) == "goodbye");
  }
  if (mode == "request-and-exit") return requestAndExit(service);
  return 64;
}

}  // namespace

// Leaves without running destructors: live connections and the dispatch
// threads simply end with the process, as a crashing client's would.
int main(int argc, char** argv) {
  const int status = run(argc, argv);
  std::fflush(stdout);
  std::fflush(stderr);
  ::_exit(status);
}
