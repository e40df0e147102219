// Service names and socket files: refused names, the directory and mode,
// replacing a stale socket, refusing a live one, and cleaning up on cancel.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <fstream>

#include "platform/mbx/Listener.h"
#include "platform/mbx/MbxError.h"
#include "tests/unit/mbx/MbxTestServer.h"
#include "tests/unit/mbx/MbxTestSupport.h"

namespace platform::mbx {
namespace {

using namespace testing;

class MbxService : public ::testing::Test {
 protected:
  std::shared_ptr<dispatch::SerialQueue> queue_ = dispatch::SerialQueue::create("test.listener");
  TemporaryRoot root_;
};

TEST_F(MbxService, BadNamesAreRefusedOnBothSides) {
  const std::vector<std::string> bad = {"", "/", "a/b", "..", "a..b", ".", std::string("a\0b", 3),
                                        "tab\there", std::string(120, 'x')};
  for (const std::string& name : bad) {
    SCOPED_TRACE(name);
    auto listener = Listener::create(name, queue_);
    ASSERT_FALSE(listener.ok());
    EXPECT_EQ(errorCodeOf(listener.error()), ErrorCode::BadServiceName);
    auto connection = Connection::connectToService(name);
    ASSERT_FALSE(connection.ok());
    EXPECT_EQ(errorCodeOf(connection.error()), ErrorCode::BadServiceName);
  }
  // Dots inside a name are fine.
  EXPECT_TRUE(Listener::create("com.corvane.qvd", queue_).ok());
}

TEST_F(MbxService, TheSocketIsMadeUnderTheRootWithMode0666) {
  auto listener = Listener::create("mode", queue_);
  ASSERT_TRUE(listener.ok());
  EXPECT_EQ(listener.value()->path(), root_.socketPath("mode"));
  struct stat st {};
  ASSERT_EQ(::stat(root_.socketPath("mode").c_str(), &st), 0);
  EXPECT_TRUE(S_ISSOCK(st.st_mode));
  EXPECT_EQ(st.st_mode & 0777, 0666u);
}

TEST_F(MbxService, AStaleSocketIsReplaced) {
  ASSERT_TRUE(Listener::create("warmup", queue_).ok());  // makes the directory
  // A socket file whose listener died: bound, then closed without unlinking.
  int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  const std::string path = root_.socketPath("stale");
  std::memcpy(address.sun_path, path.c_str(), path.size());
  ASSERT_EQ(::bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  ::close(fd);

  TestServer server("stale");
  ASSERT_TRUE(server.listening());
  EXPECT_TRUE(roundTrip("stale"));
}

TEST_F(MbxService, ALiveListenerKeepsItsName) {
  PeerProcess other({"serve", "taken"});
  ASSERT_TRUE(other.waitForLine("ready"));
  auto listener = Listener::create("taken", queue_);
  ASSERT_FALSE(listener.ok());
  EXPECT_EQ(errorCodeOf(listener.error()), ErrorCode::ServiceInUse);

  // The other process still owns the socket and answers on it.
  auto connection = Connection::connectToService("taken");
  ASSERT_TRUE(connection.ok());
  connection.value()->setEventHandler([](const ConnectionEvent&) {});
  connection.value()->resume();
  auto reply = connection.value()->sendWithReplySync(Dictionary{});
  ASSERT_TRUE(reply.ok());
  EXPECT_EQ(reply.value().dictionary()->get("pid"), Value(static_cast<long long>(other.pid())));
  connection.value()->cancel();

  // Nor is a file of another kind taken over.
  { std::ofstream(root_.socketPath("plain")) << "not a socket"; }
  auto plain = Listener::create("plain", queue_);
  ASSERT_FALSE(plain.ok());
  EXPECT_EQ(errorCodeOf(plain.error()), ErrorCode::ServiceInUse);
  EXPECT_TRUE(std::ifstream(root_.socketPath("plain")).good());
}

TEST_F(MbxService, CancelRemovesTheSocketAndEndsWithInvalid) {
  auto listener = Listener::create("gone", queue_);
  ASSERT_TRUE(listener.ok());
  auto events = std::make_shared<Recorder>();
  listener.value()->setEventHandler([events](const Listener::Event& event) {
    if (const auto* error = std::get_if<Error>(&event)) {
      events->add(errorCodeName(*errorCodeOf(*error)));
    } else {
      events->add("connection");
    }
  });
  listener.value()->resume();
  auto client = Connection::connectToService("gone");
  ASSERT_TRUE(client.ok());
  ASSERT_TRUE(eventually([&] { return events->size() == 1; }));
  listener.value()->cancel();
  listener.value()->cancel();
  listener.value().reset();  // a resumed listener lives on until it has finished
  ASSERT_TRUE(eventually([&] { return events->size() == 2; }));
  EXPECT_EQ(events->entries(), (std::vector<std::string>{"connection", "connection invalid"}));
  EXPECT_NE(::access(root_.socketPath("gone").c_str(), F_OK), 0);
  auto late = Connection::connectToService("gone");
  ASSERT_FALSE(late.ok());
  EXPECT_EQ(errorCodeOf(late.error()), ErrorCode::ServiceUnavailable);
  // The name is free again.
  EXPECT_TRUE(Listener::create("gone", queue_).ok());
}

}  // namespace
}  // namespace platform::mbx
