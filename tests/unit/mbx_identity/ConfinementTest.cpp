// Whether a peer counts as sandboxed: real children confined in each way the
// rule knows, and the rule itself on facts no test process can take on (LSM
// labels, a daemon that is itself confined).
#include <gtest/gtest.h>

#include "platform/mbx/identity/Confinement.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::kPeerProgram;
using testing::PeerProcess;

class PeerIdentityConfinementTest : public ::testing::Test {
 protected:
  void SetUp() override {
    auto self = PeerIdentity::ofSelf();
    ASSERT_TRUE(self.ok()) << self.error().description();
    self_ = *self;
  }

  // The identity of a child confined as `mode` says; null (with the test
  // skipped) when this machine does not permit that confinement.
  std::shared_ptr<const PeerIdentity> peerIn(const std::string& mode) {
    peer_ = PeerProcess::start(kPeerProgram, mode);
    if (peer_ == nullptr) return nullptr;
    if (peer_->reply() == 'S') return nullptr;
    EXPECT_EQ(peer_->reply(), 'R') << mode << " could not be applied";
    auto identity = PeerIdentity::fromSocket(peer_->connection());
    EXPECT_TRUE(identity.ok()) << identity.error().description();
    return identity.ok() ? *identity : nullptr;
  }

  std::shared_ptr<const PeerIdentity> self_;
  std::unique_ptr<PeerProcess> peer_;
};

TEST_F(PeerIdentityConfinementTest, PlainChildIsNotSandboxed) {
  auto peer = peerIn("plain");
  ASSERT_NE(peer, nullptr);
  EXPECT_FALSE(peer->isSandboxedRelativeTo(*self_))
      << peer->confinement().sandboxReasonsRelativeTo(self_->confinement());
  EXPECT_EQ(peer->mountNamespace(), self_->mountNamespace());
  EXPECT_EQ(peer->noNewPrivs(), self_->noNewPrivs());
  EXPECT_FALSE(self_->isSandboxedRelativeTo(*self_));
}

TEST_F(PeerIdentityConfinementTest, NoNewPrivsChildIsSandboxed) {
  if (self_->noNewPrivs()) GTEST_SKIP() << "this process already has NoNewPrivs";
  auto peer = peerIn("nnp");
  ASSERT_NE(peer, nullptr);
  EXPECT_TRUE(peer->noNewPrivs());
  EXPECT_TRUE(peer->isSandboxedRelativeTo(*self_));
  EXPECT_EQ(peer->confinement().sandboxReasonsRelativeTo(self_->confinement()), "no-new-privs");
}

TEST_F(PeerIdentityConfinementTest, SeccompFilteredChildIsSandboxed) {
  if (self_->seccompMode() == 2) GTEST_SKIP() << "this process already runs under a filter";
  auto peer = peerIn("seccomp");
  ASSERT_NE(peer, nullptr);
  EXPECT_EQ(peer->seccompMode(), 2);
  EXPECT_TRUE(peer->isSandboxedRelativeTo(*self_));
  EXPECT_NE(peer->confinement().sandboxReasonsRelativeTo(self_->confinement()).find("seccomp"),
            std::string::npos);
}

TEST_F(PeerIdentityConfinementTest, ChildInAnotherMountNamespaceIsSandboxed) {
  auto peer = peerIn("mntns");
  if (peer_ != nullptr && peer_->reply() == 'S') {
    GTEST_SKIP() << "unshare(CLONE_NEWNS) is not permitted here";
  }
  ASSERT_NE(peer, nullptr);
  EXPECT_NE(peer->mountNamespace(), self_->mountNamespace());
  EXPECT_TRUE(peer->isSandboxedRelativeTo(*self_));
  EXPECT_EQ(peer->confinement().sandboxReasonsRelativeTo(self_->confinement()), "mount namespace");
}

TEST(PeerIdentityConfinementRuleTest, LabelsCountOnlyWhenTheyConfine) {
  Confinement daemon;
  daemon.securityLabel = "qvd (enforce)";
  Confinement peer = daemon;
  for (const char* label : {"", "unconfined", "qvd (enforce)"}) {
    peer.securityLabel = label;
    EXPECT_FALSE(peer.isSandboxedRelativeTo(daemon)) << label;
  }
  peer.securityLabel = "browser-renderer (enforce)";
  EXPECT_TRUE(peer.isSandboxedRelativeTo(daemon));
  EXPECT_EQ(peer.sandboxReasonsRelativeTo(daemon), "security label");
}

TEST(PeerIdentityConfinementRuleTest, OnlyDifferencesFromTheDaemonCount) {
  Confinement daemon;
  daemon.seccompMode = 2;
  daemon.noNewPrivs = true;
  daemon.mountNamespace = 4026531832;
  Confinement peer = daemon;
  EXPECT_FALSE(peer.isSandboxedRelativeTo(daemon));

  // Less confined than the daemon is not sandboxed either.
  peer.seccompMode = 0;
  peer.noNewPrivs = false;
  EXPECT_FALSE(peer.isSandboxedRelativeTo(daemon));

  // Strict mode is not a filter.
  daemon = Confinement{};
  peer = Confinement{};
  peer.seccompMode = 1;
  EXPECT_FALSE(peer.isSandboxedRelativeTo(daemon));

  peer.seccompMode = 2;
  peer.noNewPrivs = true;
  peer.mountNamespace = 1;
  peer.securityLabel = "jail";
  EXPECT_EQ(peer.sandboxReasonsRelativeTo(daemon),
            "seccomp filter, no-new-privs, security label, mount namespace");
}

}  // namespace
}  // namespace platform::mbx
