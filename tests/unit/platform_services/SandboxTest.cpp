// The sandbox check against real children: each is forked, confines itself
// (or not), and connects over a socketpair whose far end gives its identity.
#include <gtest/gtest.h>
#include <sys/prctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstring>
#include <memory>

#include "platform/mbx/identity/PeerIdentity.h"
#include "platform/sandbox/LinuxSandboxCheck.h"
#include "platform/sandbox/testing/FakeSandboxCheck.h"

namespace platform::sandbox {
namespace {

enum class ChildConfinement { Plain, NoNewPrivs };

// A forked child that confines itself as asked, then makes a socketpair of
// its own and passes one end back: a socketpair carries the credentials of
// the process that made it, so that end identifies the confined child. The
// child then waits to be released. Only async-signal-safe calls run in it.
class Child {
 public:
  explicit Child(ChildConfinement confinement) {
    int control[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, control) != 0) return;
    pid_ = ::fork();
    if (pid_ == 0) {
      ::close(control[0]);
      runChild(control[1], confinement);
    }
    ::close(control[1]);
    control_ = control[0];
    if (pid_ > 0) connection_ = receiveFd(control_);
  }
  ~Child() {
    if (connection_ >= 0) ::close(connection_);
    if (control_ >= 0) ::close(control_);  // releases the child
    if (pid_ > 0) ::waitpid(pid_, nullptr, 0);
  }
  Child(const Child&) = delete;
  Child& operator=(const Child&) = delete;

  bool ready() const { return connection_ >= 0; }
  pid_t pid() const { return pid_; }

  std::shared_ptr<const mbx::PeerIdentity> identity() const {
    auto taken = mbx::PeerIdentity::fromSocket(connection_);
    EXPECT_TRUE(taken.ok()) << taken.error().description();
    return taken.ok() ? *taken : nullptr;
  }

 private:
  [[noreturn]] static void runChild(int control, ChildConfinement confinement) {
    if (confinement == ChildConfinement::NoNewPrivs &&
        ::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0) {
      ::_exit(2);
    }
    int pair[2];
    if (::socketpair(AF_UNIX, SOCK_STREAM, 0, pair) != 0) ::_exit(3);
    char byte = 'R';
    struct iovec data = {&byte, 1};
    alignas(struct cmsghdr) char space[CMSG_SPACE(sizeof(int))] = {};
    struct msghdr message = {};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = space;
    message.msg_controllen = sizeof space;
    struct cmsghdr* header = CMSG_FIRSTHDR(&message);
    header->cmsg_level = SOL_SOCKET;
    header->cmsg_type = SCM_RIGHTS;
    header->cmsg_len = CMSG_LEN(sizeof(int));
    std::memcpy(CMSG_DATA(header), &pair[0], sizeof(int));
    if (::sendmsg(control, &message, 0) != 1) ::_exit(4);
    char release;
    (void)::read(control, &release, 1);  // returns when the parent closes
    ::_exit(0);
  }

  static int receiveFd(int control) {
    char byte = 0;
    struct iovec data = {&byte, 1};
    alignas(struct cmsghdr) char space[CMSG_SPACE(sizeof(int))] = {};
    struct msghdr message = {};
    message.msg_iov = &data;
    message.msg_iovlen = 1;
    message.msg_control = space;
    message.msg_controllen = sizeof space;
    if (::recvmsg(control, &message, MSG_CMSG_CLOEXEC) != 1 || byte != 'R') return -1;
    struct cmsghdr* header = CMSG_FIRSTHDR(&message);
    if (header == nullptr || header->cmsg_type != SCM_RIGHTS) return -1;
    int fd;
    std::memcpy(&fd, CMSG_DATA(header), sizeof(int));
    return fd;
  }

  pid_t pid_ = -1;
  int control_ = -1;
  int connection_ = -1;
};

class PlatformSandboxTest : public ::testing::Test {
 protected:
  void SetUp() override {
    auto made = LinuxSandboxCheck::create();
    ASSERT_TRUE(made.ok()) << made.error().description();
    check_ = std::move(made).value();
  }
  std::unique_ptr<LinuxSandboxCheck> check_;
};

TEST_F(PlatformSandboxTest, PlainChildIsNotSandboxed) {
  Child child(ChildConfinement::Plain);
  ASSERT_TRUE(child.ready());
  auto peer = child.identity();
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->pid(), child.pid());
  EXPECT_FALSE(check_->isSandboxed(*peer));
  EXPECT_FALSE(check_->isSandboxed(check_->daemonIdentity()));
}

TEST_F(PlatformSandboxTest, NoNewPrivsChildIsSandboxed) {
  if (check_->daemonIdentity().noNewPrivs()) {
    GTEST_SKIP() << "this process already has NoNewPrivs, so a child's adds nothing";
  }
  Child child(ChildConfinement::NoNewPrivs);
  ASSERT_TRUE(child.ready());
  auto peer = child.identity();
  ASSERT_NE(peer, nullptr);
  EXPECT_TRUE(peer->noNewPrivs());
  EXPECT_TRUE(check_->isSandboxed(*peer));
}

TEST_F(PlatformSandboxTest, JudgedAgainstTheDaemonsOwnConfinement) {
  // A daemon that itself has NoNewPrivs counts it against no client: with the
  // confined child standing in as the daemon, neither child is sandboxed,
  // while the check made from this process still tells them apart.
  if (check_->daemonIdentity().noNewPrivs()) GTEST_SKIP() << "already NoNewPrivs";
  Child confined(ChildConfinement::NoNewPrivs);
  Child plain(ChildConfinement::Plain);
  ASSERT_TRUE(confined.ready() && plain.ready());
  auto confinedPeer = confined.identity();
  auto plainPeer = plain.identity();
  ASSERT_NE(confinedPeer, nullptr);
  ASSERT_NE(plainPeer, nullptr);
  LinuxSandboxCheck confinedDaemon(confinedPeer);
  EXPECT_FALSE(confinedDaemon.isSandboxed(*confinedPeer));
  EXPECT_FALSE(confinedDaemon.isSandboxed(*plainPeer));
  EXPECT_TRUE(check_->isSandboxed(*confinedPeer));
  EXPECT_FALSE(check_->isSandboxed(*plainPeer));
}

TEST(PlatformSandboxFakeTest, AnswersWhatTheTestSet) {
  Child child(ChildConfinement::Plain);
  ASSERT_TRUE(child.ready());
  auto peer = child.identity();
  ASSERT_NE(peer, nullptr);
  FakeSandboxCheck fake;
  EXPECT_FALSE(fake.isSandboxed(*peer));
  fake.setForPid(peer->pid(), Sandboxing::Sandboxed);
  EXPECT_TRUE(fake.isSandboxed(*peer));
  fake.setForPid(peer->pid(), Sandboxing::NotSandboxed);
  fake.setDefault(Sandboxing::Sandboxed);
  EXPECT_FALSE(fake.isSandboxed(*peer));
}

}  // namespace
}  // namespace platform::sandbox
