// Who may do what, asked of the real daemon by real processes: discovery of
// every plug-in needs the manager entitlement and no sandbox, a grant that
// others could have written grants nothing, and a connection never gains the
// entitlements of a process that took its maker's pid after the maker exited.
// Entitled hosts are copies of a program in the root, each with its grant: the
// daemon knows a host by the executable behind its connection.
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/utsname.h>

#include <filesystem>
#include <sstream>

#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"

namespace qvd::integration {
namespace {

namespace fs = std::filesystem;
using platform::Dictionary;

constexpr const char* kManager = "com.corvane.private.quorvex.manager";
constexpr const char* kDiscoverAll = "0x200";
const std::string kDiscoveryRefused =
    "qvctl: error 11: unauthorized discovery flag (QVDiscoverAll)";

enum class GrantFile { Trusted, WritableByOthers };

// Whether the kernel names a socket's peer by a pidfd taken at connect time
// (Linux 6.5): without it, a peer that exits before the daemon accepts is not
// told apart from a process that took its pid before the accept.
bool kernelPinsPeerAtConnect() {
  utsname name{};
  int major = 0, minor = 0;
  if (::uname(&name) != 0 || std::sscanf(name.release, "%d.%d", &major, &minor) != 2) return false;
  return major > 6 || (major == 6 && minor >= 5);
}

class PrivilegeTest : public ::testing::Test {
 protected:
  PrivilegeTest()
      : first_(writeSystemPlugIn(root_, "first")),
        second_(writeSystemPlugIn(root_, "second")),
        daemon_(root_, {}) {}
  void SetUp() override { ASSERT_TRUE(daemon_.waitUntilServing()) << daemon_.log(); }
  void TearDown() override {
    ::kill(daemon_.pid(), SIGCONT);  // whatever a failed scenario left
    EXPECT_EQ(daemon_.terminate(), 0) << daemon_.log();
  }

  // A copy of `program` at <root>/bin/<name>, granted the manager
  // entitlement by a grant file of the given kind.
  std::string manager(const std::string& program, const std::string& name, GrantFile kind) {
    const std::string executable = root_ / ("bin/" + name);
    fs::create_directories(root_ / "bin");
    fs::copy_file(program, executable);
    const std::string grant = root_ / ("etc/quorvex/entitlements/" + name + ".vmap");
    writeVmapFile(grant, Dictionary{{"executable", executable},
                                    {"entitlements", Dictionary{{kManager, true}}}});
    fs::permissions(grant, kind == GrantFile::Trusted ? fs::perms(0644) : fs::perms(0666));
    return executable;
  }
  std::string socket() const { return root_ / "run/quorvex/mbx/com.corvane.quorvex.qvd"; }
  bool registered(const std::string& path) { return runQvctl(root_, {"find", path}).status == 0; }

  TemporaryRoot root_;
  const std::string first_;
  const std::string second_;
  Daemon daemon_;
};

TEST_F(PrivilegeTest, DiscoveringEveryPlugInNeedsTheManagerEntitlementAndNoSandbox) {
  const std::string trusted = manager(QVCTL_PATH, "manager", GrantFile::Trusted);
  const std::string loose = manager(QVCTL_PATH, "loose", GrantFile::WritableByOthers);

  // The entitled, unconfined manager sees both plug-ins.
  const Finished all = runProcess({trusted, "match", "--flags", kDiscoverAll}, root_.path());
  ASSERT_EQ(all.status, 0) << all.err << daemon_.log();
  EXPECT_NE(all.out.find("com.example.first"), std::string::npos) << all.out;
  EXPECT_NE(all.out.find("com.example.second"), std::string::npos) << all.out;

  const struct {
    const char* who;
    std::vector<std::string> argv;
  } refused[] = {
      {"no grant", {QVCTL_PATH, "match", "--flags", kDiscoverAll}},
      {"a grant others may write", {loose, "match", "--flags", kDiscoverAll}},
      {"entitled, under a seccomp filter",
       {PRIVILEGE_HELPER_PATH, "confined", trusted, "match", "--flags", kDiscoverAll}},
  };
  for (const auto& attempt : refused) {
    const Finished run = runProcess(attempt.argv, root_.path());
    EXPECT_EQ(run.status, 1) << attempt.who << ": " << run.out;
    EXPECT_NE(run.err.find(kDiscoveryRefused), std::string::npos) << attempt.who << ": " << run.err;
  }
  EXPECT_EQ(
      daemon_.countLines("ignoring grant file " + root_ / "etc/quorvex/entitlements/loose.vmap"), 1)
      << "logged once, however often it is read";
}

// A connection handed down to a child outlives the process that made it;
// that pid then goes to an entitled process. The connection must keep the
// identity of its maker (or none), never take the new holder's.
TEST_F(PrivilegeTest, APidTakenOverAfterItsPeerExitedBringsNoEntitlements) {
  const std::string entitled = manager(PRIVILEGE_HELPER_PATH, "entitled", GrantFile::Trusted);
  // The grant works: the entitled program may remove.
  const Finished removed = runProcess({entitled, "remove", socket(), second_}, root_.path());
  ASSERT_EQ(removed.out, "reply 0\n") << removed.err << daemon_.log();
  ASSERT_FALSE(registered(second_));

  enum class Accept { WhileTheMakerLives, AfterThePidMovedOn };
  for (const Accept accept : {Accept::WhileTheMakerLives, Accept::AfterThePidMovedOn}) {
    const bool late = accept == Accept::AfterThePidMovedOn;
    if (late && !kernelPinsPeerAtConnect()) {
      GTEST_SKIP() << "this kernel lacks SO_PEERPIDFD: a peer gone before the accept is a "
                      "known limit there";
    }
    std::vector<std::string> argv{PRIVILEGE_HELPER_PATH, "orphan", socket(), first_, entitled};
    if (late) argv.push_back(std::to_string(daemon_.pid()));
    const Finished run = runProcess(argv, root_.path(), 120s);
    ::kill(daemon_.pid(), SIGCONT);
    if (run.status == 5) GTEST_SKIP() << "pids cannot be handed on here: " << run.err;
    ASSERT_EQ(run.status, 0) << run.out << run.err;
    std::istringstream lines(run.out);
    std::string line, reused, outcome;
    if (!late) {
      std::getline(lines, line);
      EXPECT_EQ(line, "first reply 11") << "the maker itself is refused";
    }
    std::getline(lines, reused);
    std::getline(lines, outcome);
    EXPECT_TRUE(reused.starts_with("reused ")) << run.out;
    // Early, the connection is its maker's and is refused; late, its peer is
    // gone when the daemon asks who it is, and it is closed unserved.
    EXPECT_EQ(outcome, late ? "closed" : "reply 11") << daemon_.log();
    if (late) {
      EXPECT_EQ(daemon_.countLines(" exited before its identity was taken"), 1) << daemon_.log();
    }
    EXPECT_TRUE(registered(first_));
  }
}

}  // namespace
}  // namespace qvd::integration
