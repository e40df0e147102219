// The entitlement store against real grant files: the trust rule, malformed
// grants, canonical executable paths, merging, freshness and limits.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include "platform/codesign/CodesignError.h"
#include "platform/codesign/FileTrust.h"
#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/log/LogCaptureForTesting.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::codesign {
namespace {

using services_testing::writeText;
using services_testing::writeVmap;

Dictionary grant(const std::string& executable, Dictionary entitlements) {
  return Dictionary{{"executable", Value(executable)}, {"entitlements", Value(entitlements)}};
}

class PlatformCodesignTest : public ::testing::Test {
 protected:
  void SetUp() override { writeText(host_, "#!/bin/sh\n"); }
  std::string grantFile(const std::string& name) const { return grants_ + "/" + name; }
  bool logged(const std::string& a, const std::string& b) const {
    for (const std::string& message : capture_.messages()) {
      if (message.find(a) != std::string::npos && message.find(b) != std::string::npos) return true;
    }
    return false;
  }
  static Dictionary granted(const Result<Dictionary>& result) {
    EXPECT_TRUE(result.ok()) << result.error().description();
    return result.ok() ? *result : Dictionary{{"failed", true}};
  }
  static Dictionary granted(LinuxEntitlementStore& store, const std::string& executable) {
    return granted(store.entitlementsOfExecutable(executable));
  }

  services_testing::ScratchDirectory scratch_;
  const std::string grants_ = scratch_ / "etc/quorvex/entitlements";
  const std::string host_ = scratch_ / "bin/host";
  log::LogCaptureForTesting capture_;
};

TEST(PlatformCodesignTrustTest, OwnerAndWriteBitsDecide) {
  const struct {
    uid_t owner;
    mode_t mode;
    bool trusted;
  } cases[] = {{0, 0644, true},     {1000, 0644, true}, {1001, 0644, false}, {0, 0664, false},
               {0, 0620, false},    {0, 0646, false},   {0, 0602, false},    {0, 0755, true}};
  for (const auto& c : cases) {
    struct stat status {};
    status.st_mode = S_IFREG | c.mode;
    status.st_uid = c.owner;
    EXPECT_EQ(!distrustReason(status, 1000).has_value(), c.trusted) << c.owner << std::oct << " "
                                                                   << c.mode;
  }
  struct stat foreign {};
  foreign.st_mode = S_IFREG | 0644;
  foreign.st_uid = 1001;
  EXPECT_EQ(distrustReason(foreign, 1000).value_or(""),
            "owned by uid 1001, neither root nor the daemon's uid 1000");
}

TEST_F(PlatformCodesignTest, OnlyTrustedWellFormedGrantsCountAndOthersAreLoggedOnce) {
  writeVmap(grantFile("others.vmap"), grant(host_, {{"others", true}}));
  writeVmap(grantFile("group.vmap"), grant(host_, {{"group", true}}));
  ASSERT_EQ(::chmod(grantFile("others.vmap").c_str(), 0646), 0);
  ASSERT_EQ(::chmod(grantFile("group.vmap").c_str(), 0664), 0);
  writeText(grantFile("garbage.vmap"), "this is not a document");
  writeVmap(grantFile("list.vmap"), Value(Array{Value("x")}));
  writeVmap(grantFile("noexec.vmap"), Dictionary{{"entitlements", Dictionary{{"x", true}}}});
  writeVmap(grantFile("relative.vmap"), grant("bin/host", {{"x", true}}));
  writeVmap(grantFile("flat.vmap"), Dictionary{{"executable", host_}, {"entitlements", "all"}});
  ASSERT_EQ(::symlink(grantFile("good.vmap").c_str(), grantFile("link.vmap").c_str()), 0);
  const std::pair<const char*, const char*> logs[] = {
      {"others.vmap", "writable by others"}, {"group.vmap", "writable by group"},
      {"garbage.vmap", "garbage.vmap"},      {"list.vmap", "not a dictionary"},
      {"noexec.vmap", "executable"},         {"relative.vmap", "not an absolute path"},
      {"link.vmap", "symbolic link"},        {"flat.vmap", "\"entitlements\" is not a dictionary"}};
  writeVmap(grantFile("good.vmap"), grant(host_, {{"good", true}}));
  LinuxEntitlementStore store(grants_, ::geteuid());
  EXPECT_EQ(granted(store, host_), (Dictionary{{"good", true}}));
  EXPECT_TRUE(store.entitlementValue(host_, "other").isNone());
  EXPECT_TRUE(granted(store, scratch_ / "bin/other").empty());
  for (auto [file, message] : logs) EXPECT_TRUE(logged(file, message)) << file;

  // Logged once per change of the file, not at every question.
  const std::size_t messages = capture_.size();
  (void)store.entitlementsOfExecutable(host_);
  EXPECT_EQ(capture_.size(), messages);
  // Fixing the mode makes it count.
  ASSERT_EQ(::chmod(grantFile("others.vmap").c_str(), 0644), 0);
  EXPECT_EQ(store.entitlementValue(host_, "others"), Value(true));
}

TEST_F(PlatformCodesignTest, GrantOwnedByAnotherUserCountsOnlyForADaemonOfThatUser) {
  if (::geteuid() != 0) GTEST_SKIP() << "chown to nobody needs root";
  constexpr uid_t kNobody = 65534;
  writeVmap(grantFile("host.vmap"), grant(host_, {{"com.corvane.hub", true}}));
  ASSERT_EQ(::chown(grantFile("host.vmap").c_str(), kNobody, static_cast<gid_t>(-1)), 0);
  LinuxEntitlementStore asRoot(grants_, 0);
  EXPECT_TRUE(granted(asRoot, host_).empty());
  EXPECT_TRUE(logged("host.vmap", "owned by uid 65534"));
  LinuxEntitlementStore asNobody(grants_, kNobody);
  EXPECT_EQ(asNobody.entitlementValue(host_, "com.corvane.hub"), Value(true));
}

TEST_F(PlatformCodesignTest, ExecutablePathsAreComparedCanonically) {
  services_testing::makeDirectories(scratch_ / "links");
  ASSERT_EQ(::symlink(host_.c_str(), (scratch_ / "links/host").c_str()), 0);
  ASSERT_EQ(::symlink((scratch_ / "bin").c_str(), (scratch_ / "bindir").c_str()), 0);
  writeVmap(grantFile("host.vmap"), grant(host_, {{"a", 1}}));
  // This grant names the program through a linked directory.
  writeVmap(grantFile("other.vmap"), grant(scratch_ / "bindir/host", {{"b", 2}}));
  LinuxEntitlementStore store(grants_, ::geteuid());
  for (const std::string& asked :
       {host_, scratch_ / "links/host", scratch_ / "bin/./../bin/host", scratch_ / "bindir/host"}) {
    EXPECT_EQ(granted(store, asked), (Dictionary{{"a", 1}, {"b", 2}})) << asked;
  }
  Result<Dictionary> relative = store.entitlementsOfExecutable("bin/host");
  ASSERT_FALSE(relative.ok());
  EXPECT_TRUE(isCodesignError(relative.error(), CodesignErrorCode::InvalidPath));
}

TEST_F(PlatformCodesignTest, GrantsMergeWithTheLaterFileNameWinning) {
  writeVmap(grantFile("20-late.vmap"), grant(host_, {{"shared", "late"}, {"z", 3}}));
  writeVmap(grantFile("10-early.vmap"), grant(host_, {{"shared", "early"}, {"a", 1}}));
  writeVmap(grantFile(".10-hidden.vmap"), grant(host_, {{"shared", "hidden"}}));
  LinuxEntitlementStore store(grants_, ::geteuid());
  EXPECT_EQ(granted(store, host_), (Dictionary{{"shared", "late"}, {"a", 1}, {"z", 3}}));
}

TEST_F(PlatformCodesignTest, ChangesAreSeenAndUnchangedFilesAreNotReadAgain) {
  writeVmap(grantFile("one.vmap"), grant(host_, {{"one", true}}));
  writeVmap(grantFile("two.vmap"), grant(host_, {{"two", "aa"}}));
  // Past the window in which a signature cannot be trusted.
  std::this_thread::sleep_for(std::chrono::milliseconds(2100));
  LinuxEntitlementStore store(grants_, ::geteuid());
  EXPECT_EQ(store.entitlementValue(host_, "one"), Value(true));
  EXPECT_EQ(store.entitlementValue(host_, "two"), Value("aa"));
  EXPECT_EQ(store.grantFileReadsForTesting(), 2u);

  // Rewritten in place with the same size: only that file is read again.
  const struct stat before = services_testing::statOf(grantFile("two.vmap"));
  writeText(grantFile("two.vmap"), services_testing::vmapText(grant(host_, {{"two", "bb"}})));
  const struct stat after = services_testing::statOf(grantFile("two.vmap"));
  ASSERT_EQ(after.st_ino, before.st_ino);
  ASSERT_EQ(after.st_size, before.st_size);
  EXPECT_EQ(store.entitlementValue(host_, "two"), Value("bb"));
  EXPECT_EQ(store.grantFileReadsForTesting(), 3u);

  ASSERT_EQ(::unlink(grantFile("one.vmap").c_str()), 0);
  EXPECT_TRUE(store.entitlementValue(host_, "one").isNone());
  writeVmap(grantFile("three.vmap"), grant(host_, {{"three", 3}}));
  EXPECT_EQ(store.entitlementValue(host_, "three"), Value(3));
}

TEST_F(PlatformCodesignTest, LimitsAndAMissingDirectoryGrantNothing) {
  EntitlementLimits limits;
  limits.maxGrantFiles = 3;
  for (int i = 0; i < 4; ++i) {
    writeVmap(grantFile("g" + std::to_string(i) + ".vmap"), grant(host_, {{"x", i}}));
  }
  LinuxEntitlementStore store(grants_, ::geteuid(), limits);
  Result<Dictionary> tooMany = store.entitlementsOfExecutable(host_);
  ASSERT_FALSE(tooMany.ok());
  EXPECT_TRUE(isCodesignError(tooMany.error(), CodesignErrorCode::TooManyGrantFiles));
  EXPECT_TRUE(store.entitlementValue(host_, "x").isNone());
  EXPECT_TRUE(logged("more than 3", "granting nothing"));
  ASSERT_EQ(::unlink(grantFile("g3.vmap").c_str()), 0);
  EXPECT_EQ(store.entitlementValue(host_, "x"), Value(2));

  EntitlementLimits small;
  small.file.maxBytes = 200;
  writeVmap(scratch_ / "big/big.vmap", grant(host_, {{"pad", std::string(300, 'x')}}));
  LinuxEntitlementStore big(scratch_ / "big", ::geteuid(), small);
  EXPECT_TRUE(big.entitlementValue(host_, "pad").isNone());
  EXPECT_TRUE(logged("big.vmap", "larger than 200"));

  LinuxEntitlementStore nowhere(scratch_ / "no/such/dir", ::geteuid());
  EXPECT_TRUE(granted(nowhere, host_).empty());
}

TEST_F(PlatformCodesignTest, BundleEntitlementsFollowTheSameRule) {
  const std::string bundle = scratch_ / "Demo.ovx";
  const std::string file = bundle + "/Entitlements.vmap";
  LinuxEntitlementStore store(grants_, ::geteuid());
  const auto declared = [&] { return granted(store.entitlementsOfBundle(bundle + "/")); };
  writeVmap(file, Dictionary{{"com.corvane.net", true}});
  EXPECT_EQ(declared(), (Dictionary{{"com.corvane.net", true}}));
  ASSERT_EQ(::chmod(file.c_str(), 0666), 0);
  EXPECT_TRUE(declared().empty());
  EXPECT_TRUE(logged("Entitlements.vmap", "writable by group and others"));
  // A link to some trusted file elsewhere is not the bundle's own file.
  ASSERT_EQ(::unlink(file.c_str()), 0);
  writeVmap(scratch_ / "elsewhere.vmap", Dictionary{{"stolen", true}});
  ASSERT_EQ(::symlink((scratch_ / "elsewhere.vmap").c_str(), file.c_str()), 0);
  EXPECT_TRUE(declared().empty());
  ASSERT_EQ(::unlink(file.c_str()), 0);
  EXPECT_TRUE(declared().empty());
  EXPECT_FALSE(store.entitlementsOfBundle(scratch_ / "Missing.ovx").ok());
  EXPECT_FALSE(store.entitlementsOfBundle("Demo.ovx").ok());
}

}  // namespace
}  // namespace platform::codesign
