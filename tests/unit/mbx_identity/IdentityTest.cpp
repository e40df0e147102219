// Identities of real client processes: what they name, and whether they count
// as sandboxed, for real children and for the rule on facts no test process can
// take on (LSM labels, a daemon that is itself confined).
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include "platform/mbx/identity/Confinement.h"
#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::kExecTargetProgram;
using testing::kPeerProgram;
using testing::PeerProcess;
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
  EXPECT_EQ(id->executablePath(), fs::canonical(kPeerProgram).string());
  EXPECT_EQ(id->executableInode(), inodeOf(kPeerProgram));
  EXPECT_EQ(id->description(), "pid " + std::to_string(peer->pid()) + " (uid " +
                                   std::to_string(::geteuid()) + ") " + id->executablePath());
}

TEST(PeerIdentityTest, ReportsAProgramReplacedUnderItsName) {
  testing::TempDir dir;
  const std::string path = dir.path + "/peer (deleted)";  // ends like the kernel's mark
  fs::copy_file(kPeerProgram, path);
  fs::permissions(path, fs::perms::owner_all);
  const ino_t running = inodeOf(path);
  std::unique_ptr<PeerProcess> peer = PeerProcess::start(path, "plain");
  ASSERT_NE(peer, nullptr);
  fs::remove(path);
  fs::copy_file(kExecTargetProgram, path);
  auto id = identityOf(*peer);
  ASSERT_NE(id, nullptr);
  EXPECT_EQ(id->executablePath(), path);
  EXPECT_EQ(id->executableInode(), running);
  EXPECT_TRUE(id->executableWasReplaced());
  EXPECT_TRUE(id->description().ends_with(" (replaced)")) << id->description();
}

TEST(PeerIdentityTest, RefusesSocketsWithoutAPeer) {
  internal::UniqueFd unconnected(::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0));
  internal::UniqueFd file(::open("/dev/null", O_RDONLY | O_CLOEXEC));
  auto noPeer = PeerIdentity::fromSocket(unconnected.get());
  auto notASocket = PeerIdentity::fromSocket(file.get());
  ASSERT_FALSE(noPeer.ok());
  EXPECT_TRUE(isIdentityError(noPeer.error(), IdentityErrorCode::PeerNotVisible))
      << noPeer.error().description();
  ASSERT_FALSE(notASocket.ok());
  EXPECT_TRUE(notASocket.error().is(kPosixErrorDomain, ENOTSOCK))
      << notASocket.error().description();
}

TEST(PeerIdentityConfinementTest, ChildrenConfinedInEachWayAreSandboxed) {
  auto self = PeerIdentity::ofSelf();
  ASSERT_TRUE(self.ok()) << self.error().description();
  const PeerIdentity& daemon = **self;
  EXPECT_FALSE(daemon.isSandboxedRelativeTo(daemon));
  if (daemon.noNewPrivs() || daemon.seccompMode() == 2)
    GTEST_SKIP() << "this process is confined already";
  for (const auto& [mode, reasons] :
       {std::pair{"nnp", "no-new-privs"}, std::pair{"seccomp", "seccomp filter, no-new-privs"}}) {
    std::unique_ptr<PeerProcess> child = PeerProcess::start(kPeerProgram, mode);
    ASSERT_NE(child, nullptr) << mode;
    ASSERT_EQ(child->reply(), 'R') << mode << " could not be applied";
    auto peer = identityOf(*child);
    ASSERT_NE(peer, nullptr) << mode;
    EXPECT_EQ(peer->confinement().sandboxReasonsRelativeTo(daemon.confinement()), reasons);
    EXPECT_TRUE(peer->isSandboxedRelativeTo(daemon)) << mode;
  }
}

TEST(PeerIdentityConfinementRuleTest, OnlyConfiningDifferencesFromTheDaemonCount) {
  const Confinement confined{
      .seccompMode = 2, .noNewPrivs = true, .securityLabel = "", .mountNamespace = 4026531832};
  const Confinement labelled{.securityLabel = "qvd (enforce)"};
  const std::tuple<Confinement, Confinement, const char*> cases[] = {
      {confined, {.securityLabel = "", .mountNamespace = 4026531832}, ""},  // less than the daemon
      {{}, {.seccompMode = 1, .securityLabel = ""}, ""},  // strict mode is not a filter
      {labelled, {.securityLabel = "unconfined"}, ""},
      {labelled, {.securityLabel = "browser (enforce)"}, "security label"},
      {{},
       {.seccompMode = 2, .noNewPrivs = true, .securityLabel = "jail", .mountNamespace = 1},
       "seccomp filter, no-new-privs, security label, mount namespace"},
  };
  for (const auto& [daemon, peer, reasons] : cases) {
    EXPECT_EQ(peer.sandboxReasonsRelativeTo(daemon), reasons);
    EXPECT_EQ(peer.isSandboxedRelativeTo(daemon), *reasons != '\0') << reasons;
  }
}

}  // namespace
}  // namespace platform::mbx
