// The load test's client must see what a daemon does wrong on the wire: a
// second reply, a reply to a request never sent, a message nobody asked
// for, no reply at all. A scripted server plays each fault once.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <thread>

#include "platform/mbx/Frame.h"
#include "platform/mbx/FrameReader.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/load/FrameClient.h"

namespace qvd::load {
namespace {

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::mbx::FrameKind;

struct Sent {
  FrameKind kind;
  std::uint64_t inReplyTo;
};

// Accepts one connection, reads one request and answers with `script`;
// closes the connection after it when `hangUp`, else keeps it a while.
void serveOnce(int listener, std::vector<Sent> script, bool hangUp) {
  const int fd = ::accept(listener, nullptr, nullptr);
  ASSERT_GE(fd, 0);
  platform::mbx::FrameReader reader;
  std::uint8_t buffer[4096];
  bool gotRequest = false;
  while (!gotRequest) {
    const ssize_t n = ::recv(fd, buffer, sizeof buffer, 0);
    ASSERT_GT(n, 0);
    std::span<const std::uint8_t> input(buffer, static_cast<std::size_t>(n));
    auto step = reader.next(input);
    ASSERT_TRUE(step.ok());
    gotRequest = step->has_value();
  }
  std::uint64_t id = 0;
  for (const Sent& sent : script) {
    auto frame = platform::mbx::encodeFrame(sent.kind, sent.inReplyTo,
                                            Dictionary{{"answer", static_cast<int>(id + 1)}});
    ASSERT_TRUE(frame.ok());
    platform::mbx::setMessageId(*frame, ++id);
    ASSERT_EQ(::send(fd, frame->data(), frame->size(), MSG_NOSIGNAL),
              static_cast<ssize_t>(frame->size()));
  }
  if (!hangUp) std::this_thread::sleep_for(400ms);
  ::close(fd);
}

TEST(FrameClientTest, SeesEveryFrameThatIsNotTheOneAwaitedReply) {
  struct Case {
    const char* name;
    std::vector<Sent> script;
    bool hangUp;
    bool answered;  // the request returns a reply
    int replies;    // counted for request 1
    int strays;     // after a quiet moment
    const char* problem;
  };
  const std::vector<Case> cases = {
      {"one reply", {{FrameKind::Reply, 1}}, false, true, 1, 0, ""},
      {"a second reply",
       {{FrameKind::Reply, 1}, {FrameKind::Reply, 1}},
       false,
       true,
       2,
       1,
       "reply 2 to request 1"},
      {"a reply to an id never sent",
       {{FrameKind::Reply, 9}, {FrameKind::Reply, 1}},
       false,
       true,
       1,
       1,
       "reply to request 9, never sent"},
      {"an unasked message",
       {{FrameKind::Message, 0}, {FrameKind::Reply, 1}},
       false,
       true,
       1,
       1,
       "unasked"},
      {"a hang-up instead of a reply", {}, true, false, 0, 0, "connection ended without a reply"},
      {"silence", {}, false, false, 0, 0, "no reply within"},
  };
  integration::TemporaryRoot root;
  const std::string path = root / "socket";
  const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  ASSERT_EQ(::bind(listener, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  ASSERT_EQ(::listen(listener, 4), 0);
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::thread server(serveOnce, listener, c.script, c.hangUp);
    std::optional<FrameClient> client = FrameClient::connect(path);
    ASSERT_TRUE(client);
    const std::optional<platform::Value> reply =
        client->request(platform::Value(Dictionary{{"request", "find"}}), 200ms);
    client->expectSilence(100ms);
    server.join();
    EXPECT_EQ(reply.has_value(), c.answered);
    EXPECT_EQ(client->repliesTo(1), c.replies);
    EXPECT_EQ(client->strayFrames(), c.strays);
    if (c.problem[0] == '\0') {
      EXPECT_EQ(client->problem(), "");
    } else {
      EXPECT_NE(client->problem().find(c.problem), std::string::npos) << client->problem();
    }
  }
  ::close(listener);
}

}  // namespace
}  // namespace qvd::load
