// Service names and socket files: refused names, the directory and mode,
// replacing a stale socket, refusing a live one, and cleaning up on cancel.
#include <gtest/gtest.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <fstream>

#include "platform/mbx/MbxError.h"
#include "tests/unit/mbx/MbxTestServer.h"

namespace platform::mbx {
namespace {

using namespace testing;

class MbxService : public ::testing::Test {
 protected:
  std::shared_ptr<dispatch::SerialQueue> queue_ = dispatch::SerialQueue::create("test.listener");
  TemporaryRoot root_;
};

TEST_F(MbxService, BadNamesAreRefusedOnBothSides) {
  for (const std::string& name : {std::string(), std::string("a/b"), std::string(".."),
                                  std::string("a\0b", 3), std::string(120, 'x')}) {
    EXPECT_EQ(errorCodeOf(Listener::create(name, queue_).error()), ErrorCode::BadServiceName);
    EXPECT_EQ(errorCodeOf(Connection::connectToService(name).error()), ErrorCode::BadServiceName);
  }
  // Dots inside a name are fine; the socket is made under the root, mode 0666.
  auto listener = Listener::create("com.corvane.qvd", queue_);
  ASSERT_TRUE(listener.ok());
  EXPECT_EQ(listener.value()->path(), root_.socketPath("com.corvane.qvd"));
  struct stat st {};
  ASSERT_EQ(::stat(root_.socketPath("com.corvane.qvd").c_str(), &st), 0);
  EXPECT_TRUE(S_ISSOCK(st.st_mode));
  EXPECT_EQ(st.st_mode & 0777, 0666u);
}

TEST_F(MbxService, AStaleSocketIsReplacedButALiveOneOrAFileIsNot) {
  ASSERT_TRUE(Listener::create("warmup", queue_).ok());  // makes the directory
  // A socket file whose listener died: bound, then closed without unlinking.
  int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, root_.socketPath("stale").c_str(), sizeof address.sun_path - 1);
  ASSERT_EQ(::bind(fd, reinterpret_cast<sockaddr*>(&address), sizeof address), 0);
  ::close(fd);
  TestServer server("stale");
  ASSERT_TRUE(server.listening());
  EXPECT_TRUE(roundTrip("stale"));

  PeerProcess other({"serve", "taken"});
  ASSERT_TRUE(eventually([] { return roundTrip("taken"); }));
  EXPECT_EQ(errorCodeOf(Listener::create("taken", queue_).error()), ErrorCode::ServiceInUse);
  EXPECT_TRUE(roundTrip("taken"));  // the other process still answers on it

  { std::ofstream(root_.socketPath("plain")) << "not a socket"; }
  EXPECT_EQ(errorCodeOf(Listener::create("plain", queue_).error()), ErrorCode::ServiceInUse);
  EXPECT_TRUE(std::ifstream(root_.socketPath("plain")).good());
}

TEST_F(MbxService, CancelRemovesTheSocketAndEndsWithInvalid) {
  auto listener = Listener::create("gone", queue_);
  ASSERT_TRUE(listener.ok());
  auto events = std::make_shared<Recorder>();
  listener.value()->setEventHandler([events](const Listener::Event& event) {
    const auto* error = std::get_if<Error>(&event);
    events->add(error != nullptr ? errorCodeName(*errorCodeOf(*error)) : "connection");
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
  EXPECT_EQ(errorCodeOf(Connection::connectToService("gone").error()),
            ErrorCode::ServiceUnavailable);
  EXPECT_TRUE(Listener::create("gone", queue_).ok());  // the name is free again
}

}  // namespace
}  // namespace platform::mbx
