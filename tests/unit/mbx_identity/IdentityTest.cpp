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
#include <vector>

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

struct stat statOf(const std::string& path) {
  struct stat st {};
  EXPECT_EQ(::stat(path.c_str(), &st), 0) << path;
  return st;
}

void copyProgram(const std::string& from, const std::string& to) {
  fs::copy_file(from, to);
  fs::permissions(to, fs::perms::owner_all);
}

TEST(PeerIdentityTest, NamesTheProcessThatConnected) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto identity = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(identity.ok()) << identity.error().description();
  const PeerIdentity& id = **identity;

  EXPECT_EQ(id.pid(), peer->pid());
  EXPECT_EQ(id.uid(), ::geteuid());
  EXPECT_EQ(id.gid(), ::getegid());
  const struct stat program = statOf(kPeerProgram);
  EXPECT_EQ(id.executablePath(), fs::canonical(kPeerProgram).string());
  EXPECT_EQ(id.executableDevice(), program.st_dev);
  EXPECT_EQ(id.executableInode(), program.st_ino);
  EXPECT_FALSE(id.executableWasReplaced());
  EXPECT_TRUE(id.isAlive());
  EXPECT_EQ(id.description(), "pid " + std::to_string(peer->pid()) + " (uid " +
                                  std::to_string(::geteuid()) + ") " + id.executablePath());

  // The child started after this process and before the identity was taken.
  auto self = PeerIdentity::ofSelf();
  ASSERT_TRUE(self.ok()) << self.error().description();
  EXPECT_GE(id.startTime(), (*self)->startTime());
  EXPECT_EQ((*self)->pid(), ::getpid());
  EXPECT_EQ((*self)->executablePath(), fs::canonical("/proc/self/exe").string());
}

TEST(PeerIdentityTest, PathIsCanonicalThroughSymlinks) {
  TempDir dir;
  const std::string link = dir.path() + "/link-to-peer";
  fs::create_symlink(kPeerProgram, link);
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(link, "plain");
  ASSERT_NE(peer, nullptr);
  auto identity = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(identity.ok()) << identity.error().description();
  EXPECT_EQ((*identity)->executablePath(), fs::canonical(kPeerProgram).string());
}

TEST(PeerIdentityTest, KeepsNamingTheFirstProgramAfterThePeerExecs) {
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "plain");
  ASSERT_NE(peer, nullptr);
  auto atAccept = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(atAccept.ok()) << atAccept.error().description();

  ASSERT_TRUE(peer->execTarget());
  EXPECT_EQ((*atAccept)->executablePath(), fs::canonical(kPeerProgram).string());
  EXPECT_EQ((*atAccept)->executableInode(), statOf(kPeerProgram).st_ino);
  EXPECT_TRUE((*atAccept)->isAlive());

  // Taken again on the same connection, it names what the process runs now:
  // this is why the daemon takes it only at accept.
  auto later = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(later.ok()) << later.error().description();
  EXPECT_EQ((*later)->pid(), (*atAccept)->pid());
  EXPECT_EQ((*later)->startTime(), (*atAccept)->startTime());
  EXPECT_EQ((*later)->executablePath(), fs::canonical(kExecTargetProgram).string());
  EXPECT_EQ((*later)->executableInode(), statOf(kExecTargetProgram).st_ino);
}

TEST(PeerIdentityTest, ReportsAnExecutableReplacedAfterStart) {
  TempDir dir;
  const std::string path = dir.path() + "/peer-copy";
  copyProgram(kPeerProgram, path);
  const ino_t running = statOf(path).st_ino;
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(path, "plain");
  ASSERT_NE(peer, nullptr);
  // Another file now has the name; the running one has none.
  fs::remove(path);
  copyProgram(kExecTargetProgram, path);

  auto identity = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(identity.ok()) << identity.error().description();
  EXPECT_TRUE((*identity)->executableWasReplaced());
  EXPECT_EQ((*identity)->executablePath(), fs::canonical(dir.path()).string() + "/peer-copy");
  EXPECT_EQ((*identity)->executableInode(), running);
  EXPECT_NE((*identity)->executableInode(), statOf(path).st_ino);
  EXPECT_TRUE((*identity)->description().ends_with("/peer-copy (replaced)"));
}

TEST(PeerIdentityTest, KeepsAFileNameThatEndsLikeTheDeletedMark) {
  TempDir dir;
  const std::string path = dir.path() + "/peer (deleted)";
  copyProgram(kPeerProgram, path);
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(path, "plain");
  ASSERT_NE(peer, nullptr);
  auto identity = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(identity.ok()) << identity.error().description();
  EXPECT_FALSE((*identity)->executableWasReplaced());
  EXPECT_EQ((*identity)->executablePath(), fs::canonical(path).string());
}

// Splits the stat line the way only a reader who knows the name can.
std::uint64_t startTimeKnowingName(pid_t pid, const std::string& name) {
  std::ifstream file("/proc/" + std::to_string(pid) + "/stat");
  std::string line((std::istreambuf_iterator<char>(file)), std::istreambuf_iterator<char>());
  const std::string prefix = std::to_string(pid) + " (" + name + ") ";
  EXPECT_TRUE(line.starts_with(prefix)) << line;
  std::istringstream fields(line.substr(prefix.size()));
  std::string field;
  for (int i = 3; i <= 22; ++i) fields >> field;
  return std::stoull(field);
}

TEST(PeerIdentityTest, ReadsTheStartTimeBehindACraftedCommandName) {
  // Tries to shift the fields: a ')' and numbers, within the 15 bytes a name
  // may have.
  const std::string name = "x) R 1 2 3 4 (y";
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(kPeerProgram, "name", name);
  ASSERT_NE(peer, nullptr);
  ASSERT_EQ(peer->reply(), 'R');
  auto identity = PeerIdentity::fromSocket(peer->connection());
  ASSERT_TRUE(identity.ok()) << identity.error().description();
  EXPECT_EQ((*identity)->startTime(), startTimeKnowingName(peer->pid(), name));
}

TEST(PeerIdentityTest, RefusesSocketsWithoutAPeer) {
  const int unconnected = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  ASSERT_GE(unconnected, 0);
  auto identity = PeerIdentity::fromSocket(unconnected);
  ASSERT_FALSE(identity.ok());
  EXPECT_TRUE(isIdentityError(identity.error(), IdentityErrorCode::PeerNotVisible))
      << identity.error().description();
  ::close(unconnected);

  const int file = ::open("/dev/null", O_RDONLY | O_CLOEXEC);
  ASSERT_GE(file, 0);
  auto notASocket = PeerIdentity::fromSocket(file);
  ASSERT_FALSE(notASocket.ok());
  EXPECT_TRUE(notASocket.error().is(kPosixErrorDomain, ENOTSOCK))
      << notASocket.error().description();
  ::close(file);
}

}  // namespace
}  // namespace platform::mbx
