// The sandbox check against real children: each is forked, confines itself
// (or not) and connects to a socket of the test's, so that the accepted end
// carries the child's identity.
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <memory>

#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/sandbox/LinuxSandboxCheck.h"

namespace platform::sandbox {
namespace {

// A forked child, with NoNewPrivs if asked, connected until it is destroyed.
// Only async-signal-safe calls run in the child.
class Child {
 public:
  explicit Child(bool noNewPrivs) {
    const int listener = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_un address {};
    socklen_t length = sizeof(sa_family_t);
    address.sun_family = AF_UNIX;  // bound to a fresh abstract name
    if (::bind(listener, reinterpret_cast<sockaddr*>(&address), length) != 0 ||
        ::listen(listener, 1) != 0 || (length = sizeof address) == 0 ||
        ::getsockname(listener, reinterpret_cast<sockaddr*>(&address), &length) != 0) {
      ADD_FAILURE() << "listen";
    } else if ((pid_ = ::fork()) == 0) {
      if (noNewPrivs && ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) ::_exit(2);
      const int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
      if (::connect(fd, reinterpret_cast<sockaddr*>(&address), length) != 0) ::_exit(3);
      char release;
      (void)::read(fd, &release, 1);  // returns when the parent closes
      ::_exit(0);
    }
    struct pollfd entry = {listener, POLLIN, 0};
    if (pid_ > 0 && ::poll(&entry, 1, 10'000) == 1) {
      connection_ = ::accept4(listener, nullptr, nullptr, SOCK_CLOEXEC);
    }
    ::close(listener);
  }
  ~Child() {
    if (connection_ >= 0) ::close(connection_);
    if (pid_ > 0) ::waitpid(pid_, nullptr, 0);
  }

  pid_t pid() const { return pid_; }
  std::shared_ptr<const mbx::PeerIdentity> identity() const {
    auto taken = mbx::PeerIdentity::fromSocket(connection_);
    EXPECT_TRUE(taken.ok()) << taken.error().description();
    return taken.ok() ? *taken : nullptr;
  }

 private:
  pid_t pid_ = -1;
  int connection_ = -1;
};

TEST(PlatformSandboxTest, NoNewPrivsCountsUnlessTheDaemonHasItToo) {
  auto made = LinuxSandboxCheck::create();
  ASSERT_TRUE(made.ok()) << made.error().description();
  const LinuxSandboxCheck& check = **made;
  Child plainChild(false);
  auto plain = plainChild.identity();
  ASSERT_NE(plain, nullptr);
  EXPECT_EQ(plain->pid(), plainChild.pid());
  EXPECT_FALSE(check.isSandboxed(*plain));
  EXPECT_FALSE(check.isSandboxed(check.daemonIdentity()));

  if (check.daemonIdentity().noNewPrivs()) GTEST_SKIP() << "this process already has NoNewPrivs";
  Child confinedChild(true);
  auto confined = confinedChild.identity();
  ASSERT_NE(confined, nullptr);
  EXPECT_TRUE(confined->noNewPrivs());
  EXPECT_TRUE(check.isSandboxed(*confined));
  // With the confined child standing in as the daemon, neither counts.
  LinuxSandboxCheck confinedDaemon(confined);
  EXPECT_FALSE(confinedDaemon.isSandboxed(*confined));
  EXPECT_FALSE(confinedDaemon.isSandboxed(*plain));
}

}  // namespace
}  // namespace platform::sandbox
