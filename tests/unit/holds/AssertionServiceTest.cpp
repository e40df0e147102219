// The Linux assertion service against real plug-in processes and real
// locks: busy exactly while the lock is held, stale files ignored, and the
// untrusted directory contents kept in bounds.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "platform/vouchd/LinuxAssertionService.h"
#include "tests/unit/holds/HoldsTestSupport.h"
#include "tests/unit/holds/PlugInProcess.h"

namespace qvd::holds_testing {
namespace {

using platform::vouchd::AssertionLimits;
using platform::vouchd::ExtensionInstance;
using platform::vouchd::LinuxAssertionService;

class AssertionServiceTest : public ::testing::Test {
 protected:
  std::string assertionsOf(const std::string& bundleIdentifier) const {
    return service_.directory() + "/" + bundleIdentifier;
  }
  std::unique_ptr<PlugInProcess> startInstance(const std::string& bundleIdentifier) {
    const std::string bundle = writeBundle(dir_ / (bundleIdentifier + ".ovx"), bundleIdentifier);
    return PlugInProcess::start(installPlugInExecutable(bundle), assertionsOf(bundleIdentifier));
  }
  // The pids reported for `identifiers`, in the order reported.
  std::vector<int> busyPids(const std::set<std::string>& identifiers) const {
    auto instances = service_.busyExtensionInstances(identifiers);
    EXPECT_TRUE(instances.ok()) << (instances.ok() ? "" : instances.error().description());
    std::vector<int> pids;
    if (instances.ok()) {
      for (const ExtensionInstance& instance : *instances) pids.push_back(instance.pid);
    }
    return pids;
  }

  TempDir dir_;
  LinuxAssertionService service_{dir_ / "assertions"};
};

TEST_F(AssertionServiceTest, BusyExactlyWhileTheProcessHoldsItsLock) {
  auto plugIn = startInstance("com.example.a");
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{}) << "nothing asserted yet";

  ASSERT_TRUE(plugIn->becomeBusy());
  auto instances = service_.busyExtensionInstances({"com.example.a"});
  ASSERT_TRUE(instances.ok());
  ASSERT_EQ(instances->size(), 1u);
  EXPECT_EQ((*instances)[0].pid, plugIn->pid());
  EXPECT_EQ(
      (*instances)[0].properties,
      (platform::Dictionary{{"BXBundleIdentifier", "com.example.a"}, {"pid", plugIn->pid()}}));

  ASSERT_TRUE(plugIn->becomeIdle());
  ASSERT_TRUE(
      std::filesystem::exists(assertionsOf("com.example.a") + "/" + std::to_string(plugIn->pid())));
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{}) << "a stale file is no assertion";

  ASSERT_TRUE(plugIn->becomeBusy());
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{plugIn->pid()});
  // A process that dies holding its lock loses it with everything else.
  ::kill(plugIn->pid(), SIGKILL);
  ASSERT_TRUE(plugIn->exited(std::chrono::seconds(5)));
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{});
}

TEST_F(AssertionServiceTest, OnlyTheBundlesAskedAboutInSetOrder) {
  auto b = startInstance("com.example.b");
  auto a = startInstance("com.example.a");
  ASSERT_TRUE(a && b);
  ASSERT_TRUE(a->becomeBusy());
  ASSERT_TRUE(b->becomeBusy());
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{a->pid()});
  EXPECT_EQ(busyPids({"com.example.b", "com.example.a"}), (std::vector<int>{a->pid(), b->pid()}));
  EXPECT_EQ(busyPids({"com.example.c"}), std::vector<int>{});
  EXPECT_EQ(busyPids({}), std::vector<int>{});
}

TEST_F(AssertionServiceTest, UntrustedEntriesAreSkippedWithoutBlocking) {
  const std::string bundle = assertionsOf("com.example.a");
  std::filesystem::create_directories(bundle + "/4243");     // a directory
  ASSERT_EQ(::mkfifo((bundle + "/4244").c_str(), 0644), 0);  // opening must not block
  HeldLock target(dir_ / "elsewhere");
  std::filesystem::create_symlink(dir_ / "elsewhere", bundle + "/4242");
  HeldLock notAPid(bundle + "/12abc");
  HeldLock leadingZero(bundle + "/0042");
  HeldLock tooLarge(bundle + "/99999999");
  HeldLock genuine(bundle + "/4245");
  ASSERT_TRUE(target.held() && notAPid.held() && leadingZero.held() && tooLarge.held() &&
              genuine.held());
  EXPECT_EQ(busyPids({"com.example.a"}), std::vector<int>{4245});

  // A bundle directory that is a link is not followed either.
  std::filesystem::create_directory_symlink(bundle, assertionsOf("com.example.link"));
  EXPECT_EQ(busyPids({"com.example.link"}), std::vector<int>{});
}

TEST_F(AssertionServiceTest, IdentifiersThatAreNoPathComponentHaveNoInstances) {
  // A lock right under the assertion directory, where ".." or "" would lead.
  std::filesystem::create_directories(service_.directory() + "/x");
  HeldLock above(service_.directory() + "/4246");
  HeldLock inside(service_.directory() + "/x/4247");
  ASSERT_TRUE(above.held() && inside.held());
  EXPECT_EQ(busyPids({"", ".", "..", "x/..", "x/../x", std::string(251, 'x')}), std::vector<int>{});
  EXPECT_EQ(busyPids({"x"}), std::vector<int>{4247});
}

TEST_F(AssertionServiceTest, EntriesPerBundleAreBounded) {
  LinuxAssertionService bounded(service_.directory(), AssertionLimits{.maxEntriesPerBundle = 3});
  const std::string bundle = assertionsOf("com.example.many");
  std::filesystem::create_directories(bundle);
  std::vector<std::unique_ptr<HeldLock>> locks;
  for (int pid = 100; pid < 110; ++pid) {
    locks.push_back(std::make_unique<HeldLock>(bundle + "/" + std::to_string(pid)));
  }
  auto instances = bounded.busyExtensionInstances({"com.example.many"});
  ASSERT_TRUE(instances.ok());
  EXPECT_EQ(instances->size(), 3u);
  EXPECT_EQ(busyPids({"com.example.many"}).size(), 10u);
}

TEST_F(AssertionServiceTest, AnUnreadableDirectoryIsAnError) {
  if (::geteuid() == 0) GTEST_SKIP() << "root reads any directory";
  const std::string bundle = assertionsOf("com.example.closed");
  std::filesystem::create_directories(bundle);
  ::chmod(bundle.c_str(), 0);
  EXPECT_FALSE(service_.busyExtensionInstances({"com.example.closed"}).ok());
  ::chmod(bundle.c_str(), 0755);
}

}  // namespace
}  // namespace qvd::holds_testing
