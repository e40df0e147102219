// Whether a peer counts as sandboxed: real children confined in each way the
// rule knows, and the rule itself on facts no test process can take on (LSM
// labels, a daemon that is itself confined).
#include <gtest/gtest.h>

#include "platform/mbx/identity/Confinement.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "tests/unit/mbx_identity/PeerProcess.h"

namespace platform::mbx {
namespace {

using testing::PeerProcess;

TEST(PeerIdentityConfinementTest, ChildrenConfinedInEachWayAreSandboxed) {
  auto self = PeerIdentity::ofSelf();
  ASSERT_TRUE(self.ok()) << self.error().description();
  const PeerIdentity& daemon = **self;
  EXPECT_FALSE(daemon.isSandboxedRelativeTo(daemon));
  const struct {
    const char* mode;
    bool alreadyConfined;  // this process has it too, so a child's adds nothing
    const char* reasons;
  } cases[] = {
      {"plain", false, ""},
      {"nnp", daemon.noNewPrivs(), "no-new-privs"},
      {"seccomp", daemon.seccompMode() == 2,
       daemon.noNewPrivs() ? "seccomp filter" : "seccomp filter, no-new-privs"},
      {"mntns", false, "mount namespace"},
  };
  for (const auto& c : cases) {
    if (c.alreadyConfined) continue;
    std::unique_ptr<PeerProcess> child = PeerProcess::start(testing::kPeerProgram, c.mode);
    ASSERT_NE(child, nullptr) << c.mode;
    if (child->reply() == 'S') continue;  // not permitted on this machine
    ASSERT_EQ(child->reply(), 'R') << c.mode << " could not be applied";
    auto taken = PeerIdentity::fromSocket(child->connection());
    ASSERT_TRUE(taken.ok()) << c.mode << ": " << taken.error().description();
    const PeerIdentity& peer = **taken;
    EXPECT_EQ(peer.confinement().sandboxReasonsRelativeTo(daemon.confinement()), c.reasons)
        << c.mode;
    EXPECT_EQ(peer.isSandboxedRelativeTo(daemon), *c.reasons != '\0') << c.mode;
    const std::string mode = c.mode;
    EXPECT_EQ(peer.noNewPrivs(), mode == "nnp" || mode == "seccomp" || daemon.noNewPrivs()) << mode;
    EXPECT_EQ(peer.seccompMode() == 2, mode == "seccomp" || daemon.seccompMode() == 2) << mode;
    EXPECT_EQ(peer.mountNamespace() != daemon.mountNamespace(), mode == "mntns") << mode;
  }
}

TEST(PeerIdentityConfinementRuleTest, OnlyConfiningDifferencesFromTheDaemonCount) {
  const Confinement confined{
      .seccompMode = 2, .noNewPrivs = true, .securityLabel = "", .mountNamespace = 4026531832};
  const Confinement labelled{.securityLabel = "qvd (enforce)"};
  const struct {
    const char* what;
    Confinement daemon;
    Confinement peer;
    const char* reasons;
  } cases[] = {
      {"same as a confined daemon", confined, confined, ""},
      {"less confined than the daemon", confined, {.securityLabel = "", .mountNamespace = 4026531832}, ""},
      {"strict mode is not a filter", {}, {.seccompMode = 1, .securityLabel = ""}, ""},
      {"no label", labelled, {}, ""},
      {"unconfined label", labelled, {.securityLabel = "unconfined"}, ""},
      {"the daemon's own label", labelled, labelled, ""},
      {"another label", labelled, {.securityLabel = "browser (enforce)"}, "security label"},
      {"all at once", {},
       {.seccompMode = 2, .noNewPrivs = true, .securityLabel = "jail", .mountNamespace = 1},
       "seccomp filter, no-new-privs, security label, mount namespace"},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(c.peer.sandboxReasonsRelativeTo(c.daemon), c.reasons) << c.what;
    EXPECT_EQ(c.peer.isSandboxedRelativeTo(c.daemon), *c.reasons != '\0') << c.what;
  }
}

}  // namespace
}  // namespace platform::mbx
