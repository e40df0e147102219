// Identities of real client processes: what they name, and that they keep
// naming it when the peer later runs another program.
#include <fcntl.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <sstream>

#include <gtest/gtest.h>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::kExecTargetProgram;
using testing::kPeerProgram;
using testing::PeerProcess;
using testing::TempDir;
namespace fs = std::filesystem;

ino_t inodeOf(const std::string& path) {
  struct stat st {};
  EXPECT_EQ(::stat(path.c_str(), &st), 0) << path;
  return st.st_ino;
}

std::shared_ptr<const PeerIdentity> identityOf(const PeerProcess& peer) {
  auto identity = PeerIdentity::fromSocket(peer.connection());
  EXPECT_TRUE(identity.ok()) << identity.error().description();
  return identity.ok() ? *identity : nullptr;
}

TEST(PeerIdentityTest, NamesTheProcessThatConnected) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto id = identityOf(*peer);
  ASSERT_NE(id, nullptr);
  EXPECT_EQ(id->pid(), peer->pid());
  EXPECT_EQ(id->uid(), ::geteuid());
  EXPECT_EQ(id->gid(), ::getegid());
  struct stat program {};
  ASSERT_EQ(::stat(kPeerProgram, &program), 0);
  EXPECT_EQ(id->executablePath(), fs::canonical(kPeerProgram).string());
  EXPECT_EQ(id->executableDevice(), program.st_dev);
  EXPECT_EQ(id->executableInode(), program.st_ino);
  EXPECT_TRUE(id->isAlive());
  EXPECT_EQ(id->description(), "pid " + std::to_string(peer->pid()) + " (uid " +
                                   std::to_string(::geteuid()) + ") " + id->executablePath());
  // The child started after this process and before the identity was taken.
  auto self = PeerIdentity::ofSelf();
  ASSERT_TRUE(self.ok()) << self.error().description();
  EXPECT_GE(id->startTime(), (*self)->startTime());
  EXPECT_EQ((*self)->pid(), ::getpid());
  EXPECT_EQ((*self)->executablePath(), fs::canonical("/proc/self/exe").string());
}

TEST(PeerIdentityTest, PathIsCanonicalAndReplacementIsReported) {
  const struct {
    const char* name;
    bool link;     // run through a symbolic link to the peer program
    bool replace;  // put another file under the name once it runs
  } cases[] = {{"link-to-peer", true, false},
               {"peer (deleted)", false, false},  // ends like the kernel's mark
               {"peer-copy", false, true}};
  for (const auto& c : cases) {
    TempDir dir;
    const std::string path = dir.path() + "/" + c.name;
    if (c.link) {
      fs::create_symlink(kPeerProgram, path);
    } else {
      fs::copy_file(kPeerProgram, path);
      fs::permissions(path, fs::perms::owner_all);
    }
    const std::string expected = fs::canonical(path).string();
    const ino_t running = inodeOf(expected);
    std::unique_ptr<PeerProcess> peer = PeerProcess::start(path, "plain");
    ASSERT_NE(peer, nullptr) << c.name;
    if (c.replace) {
      fs::remove(path);
      fs::copy_file(kExecTargetProgram, path);
    }
    auto id = identityOf(*peer);
    ASSERT_NE(id, nullptr) << c.name;
    EXPECT_EQ(id->executablePath(), expected) << c.name;
    EXPECT_EQ(id->executableInode(), running) << c.name;
    EXPECT_EQ(id->executableWasReplaced(), c.replace) << c.name;
    EXPECT_EQ(id->description().ends_with(" (replaced)"), c.replace) << c.name;
  }
}

TEST(PeerIdentityTest, KeepsNamingTheFirstProgramAfterThePeerExecs) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto atAccept = identityOf(*peer);
  ASSERT_NE(atAccept, nullptr);
  ASSERT_TRUE(peer->execTarget());
  EXPECT_EQ(atAccept->executablePath(), fs::canonical(kPeerProgram).string());
  EXPECT_EQ(atAccept->executableInode(), inodeOf(kPeerProgram));
  EXPECT_TRUE(atAccept->isAlive());

  // Taken again on the same connection, it names what the process runs now:
  // this is why the daemon takes it only at accept.
  auto later = identityOf(*peer);
  ASSERT_NE(later, nullptr);
  EXPECT_EQ(later->pid(), atAccept->pid());
  EXPECT_EQ(later->startTime(), atAccept->startTime());
  EXPECT_EQ(later->executablePath(), fs::canonical(kExecTargetProgram).string());
  EXPECT_EQ(later->executableInode(), inodeOf(kExecTargetProgram));
}

TEST(PeerIdentityTest, ReadsTheStartTimeBehindACraftedCommandName) {
  // Tries to shift the fields: a ')' and numbers, within the 15 bytes a name
  // may have.
  const std::string name = "x) R 1 2 3 4 (y";
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "name", name);
  ASSERT_NE(peer, nullptr);
  ASSERT_EQ(peer->reply(), 'R');
  auto id = identityOf(*peer);
  ASSERT_NE(id, nullptr);
  // Split the stat line the way only a reader who knows the name can.
  std::ifstream file("/proc/" + std::to_string(peer->pid()) + "/stat");
  std::string line((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  const std::string prefix = std::to_string(peer->pid()) + " (" + name + ") ";
  ASSERT_TRUE(line.starts_with(prefix)) << line;
  std::istringstream fields(line.substr(prefix.size()));
  std::string field;
  for (int i = 3; i <= 22; ++i) fields >> field;
  EXPECT_EQ(id->startTime(), std::stoull(field));
}

TEST(PeerIdentityTest, RefusesSocketsWithoutAPeer) {
  const int unconnected = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  const int file = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
  auto noPeer = PeerIdentity::fromSocket(unconnected);
  auto notASocket = PeerIdentity::fromSocket(file);
  ::close(unconnected);
  ::close(file);
  ASSERT_FALSE(noPeer.ok());
  EXPECT_TRUE(isIdentityError(noPeer.error(), IdentityErrorCode::PeerNotVisible))
      << noPeer.error().description();
  ASSERT_FALSE(notASocket.ok());
  EXPECT_TRUE(notASocket.error().is(kPosixErrorDomain, ENOTSOCK))
      << notASocket.error().description();
}

}  // namespace
}  // namespace platform::mbx
