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

using services_testing::ScratchDirectory;
using services_testing::writeText;
using services_testing::writeVmap;

constexpr uid_t kNobody = 65534;

Dictionary grant(const std::string& executable, Dictionary entitlements) {
  return Dictionary{{"executable", Value(executable)}, {"entitlements", Value(entitlements)}};
}

bool anyMessageHas(const log::LogCaptureForTesting& capture, const std::string& a,
                   const std::string& b) {
  for (const std::string& message : capture.messages()) {
    if (message.find(a) != std::string::npos && message.find(b) != std::string::npos) return true;
  }
  return false;
}

class PlatformCodesignTest : public ::testing::Test {
 protected:
  void SetUp() override {
    grants_ = scratch_ / "etc/quorvex/entitlements";
    host_ = scratch_ / "bin/host";
    writeText(host_, "#!/bin/sh\n");
  }

  std::string grantFile(const std::string& name) const { return grants_ + "/" + name; }

  ScratchDirectory scratch_;
  std::string grants_;
  std::string host_;
  log::LogCaptureForTesting capture_;
};

TEST_F(PlatformCodesignTest, TrustedGrantCounts) {
  writeVmap(grantFile("host.vmap"), grant(host_, {{"com.corvane.hub", true}}));
  LinuxEntitlementStore store(grants_, ::geteuid());
  Result<Dictionary> granted = store.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok()) << granted.error().description();
  EXPECT_EQ(*granted, (Dictionary{{"com.corvane.hub", true}}));
  EXPECT_EQ(store.entitlementValue(host_, "com.corvane.hub"), Value(true));
  EXPECT_TRUE(store.entitlementValue(host_, "other").isNone());
  Result<Dictionary> stranger = store.entitlementsOfExecutable(scratch_ / "bin/other");
  ASSERT_TRUE(stranger.ok());
  EXPECT_TRUE(stranger->empty());
  EXPECT_EQ(capture_.size(), 0u);
}

TEST_F(PlatformCodesignTest, GrantWritableByGroupOrOthersIsIgnoredAndLogged) {
  writeVmap(grantFile("a.vmap"), grant(host_, {{"byOthers", true}}));
  writeVmap(grantFile("b.vmap"), grant(host_, {{"byGroup", true}}));
  writeVmap(grantFile("c.vmap"), grant(host_, {{"fine", true}}));
  ASSERT_EQ(::chmod(grantFile("a.vmap").c_str(), 0646), 0);
  ASSERT_EQ(::chmod(grantFile("b.vmap").c_str(), 0664), 0);
  LinuxEntitlementStore store(grants_, ::geteuid());
  Result<Dictionary> granted = store.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok());
  EXPECT_EQ(*granted, (Dictionary{{"fine", true}}));
  EXPECT_TRUE(anyMessageHas(capture_, "a.vmap", "writable by others"));
  EXPECT_TRUE(anyMessageHas(capture_, "b.vmap", "writable by group"));

  // Logged once per change of the file, not at every question.
  const std::size_t logged = capture_.size();
  (void)store.entitlementsOfExecutable(host_);
  EXPECT_EQ(capture_.size(), logged);

  // Fixing the mode makes it count.
  ASSERT_EQ(::chmod(grantFile("a.vmap").c_str(), 0644), 0);
  EXPECT_EQ(store.entitlementValue(host_, "byOthers"), Value(true));
}

TEST_F(PlatformCodesignTest, GrantOwnedByAnotherUserIsIgnoredUnlessItIsTheDaemons) {
  if (::geteuid() != 0) GTEST_SKIP() << "chown to nobody needs root";
  writeVmap(grantFile("host.vmap"), grant(host_, {{"com.corvane.hub", true}}));
  ASSERT_EQ(::chown(grantFile("host.vmap").c_str(), kNobody, static_cast<gid_t>(-1)), 0);

  LinuxEntitlementStore asRoot(grants_, 0);
  Result<Dictionary> granted = asRoot.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok());
  EXPECT_TRUE(granted->empty());
  EXPECT_TRUE(anyMessageHas(capture_, "host.vmap", "owned by uid 65534"));

  // A daemon running as that user wrote it itself: it counts.
  LinuxEntitlementStore asNobody(grants_, kNobody);
  EXPECT_EQ(asNobody.entitlementValue(host_, "com.corvane.hub"), Value(true));
}

TEST_F(PlatformCodesignTest, MalformedGrantsAreIgnoredAndLogged) {
  writeText(grantFile("garbage.vmap"), "this is not a document");
  writeVmap(grantFile("list.vmap"), Value(Array{Value("x")}));
  writeVmap(grantFile("noexec.vmap"), Dictionary{{"entitlements", Dictionary{{"x", true}}}});
  writeVmap(grantFile("relative.vmap"), grant("bin/host", {{"x", true}}));
  writeVmap(grantFile("flat.vmap"),
            Dictionary{{"executable", Value(host_)}, {"entitlements", Value("all")}});
  ASSERT_EQ(::symlink(grantFile("good.vmap").c_str(), grantFile("link.vmap").c_str()), 0);
  writeVmap(grantFile("good.vmap"), grant(host_, {{"good", true}}));

  LinuxEntitlementStore store(grants_, ::geteuid());
  Result<Dictionary> granted = store.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok());
  EXPECT_EQ(*granted, (Dictionary{{"good", true}}));
  EXPECT_TRUE(anyMessageHas(capture_, "garbage.vmap", "garbage.vmap"));
  EXPECT_TRUE(anyMessageHas(capture_, "list.vmap", "not a dictionary"));
  EXPECT_TRUE(anyMessageHas(capture_, "noexec.vmap", "executable"));
  EXPECT_TRUE(anyMessageHas(capture_, "relative.vmap", "not an absolute path"));
  EXPECT_TRUE(anyMessageHas(capture_, "flat.vmap", "\"entitlements\" is not a dictionary"));
  EXPECT_TRUE(anyMessageHas(capture_, "link.vmap", "symbolic link"));
}

TEST_F(PlatformCodesignTest, ExecutablePathsAreComparedCanonically) {
  // The grant names the real file; the host is reached through a link and
  // through "." and "..".
  services_testing::makeDirectories(scratch_ / "links");
  ASSERT_EQ(::symlink(host_.c_str(), (scratch_ / "links/host").c_str()), 0);
  ASSERT_EQ(::symlink((scratch_ / "bin").c_str(), (scratch_ / "bindir").c_str()), 0);
  writeVmap(grantFile("host.vmap"), grant(host_, {{"a", 1}}));
  // This grant names the program through a linked directory.
  writeVmap(grantFile("other.vmap"), grant(scratch_ / "bindir/host", {{"b", 2}}));

  LinuxEntitlementStore store(grants_, ::geteuid());
  const Dictionary expected{{"a", 1}, {"b", 2}};
  for (const std::string& asked :
       {host_, scratch_ / "links/host", scratch_ / "bin/./../bin/host", scratch_ / "bindir/host"}) {
    Result<Dictionary> granted = store.entitlementsOfExecutable(asked);
    ASSERT_TRUE(granted.ok()) << asked;
    EXPECT_EQ(*granted, expected) << asked;
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
  Result<Dictionary> granted = store.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok());
  EXPECT_EQ(*granted, (Dictionary{{"shared", "late"}, {"a", 1}, {"z", 3}}));
}

TEST_F(PlatformCodesignTest, ChangesAreSeenAndUnchangedFilesAreNotReadAgain) {
  writeVmap(grantFile("one.vmap"), grant(host_, {{"one", true}}));
  writeVmap(grantFile("two.vmap"), grant(host_, {{"two", "aa"}}));
  // Past the window in which a signature cannot be trusted.
  std::this_thread::sleep_for(std::chrono::milliseconds(2100));
  LinuxEntitlementStore store(grants_, ::geteuid());
  EXPECT_EQ(store.entitlementValue(host_, "one"), Value(true));
  EXPECT_EQ(store.grantFileReadsForTesting(), 2u);
  EXPECT_EQ(store.entitlementValue(host_, "two"), Value("aa"));
  EXPECT_EQ(store.grantFileReadsForTesting(), 2u);

  // Rewritten in place with the same size: only that file is read again.
  const ino_t inode = services_testing::inodeOf(grantFile("two.vmap"));
  const off_t size = std::filesystem::file_size(grantFile("two.vmap"));
  writeText(grantFile("two.vmap"), services_testing::vmapText(grant(host_, {{"two", "bb"}})));
  ASSERT_EQ(services_testing::inodeOf(grantFile("two.vmap")), inode);
  ASSERT_EQ(static_cast<off_t>(std::filesystem::file_size(grantFile("two.vmap"))), size);
  EXPECT_EQ(store.entitlementValue(host_, "two"), Value("bb"));
  EXPECT_EQ(store.grantFileReadsForTesting(), 3u);

  ASSERT_EQ(::unlink(grantFile("one.vmap").c_str()), 0);
  EXPECT_TRUE(store.entitlementValue(host_, "one").isNone());
  writeVmap(grantFile("three.vmap"), grant(host_, {{"three", 3}}));
  EXPECT_EQ(store.entitlementValue(host_, "three"), Value(3));
}

TEST_F(PlatformCodesignTest, TooManyGrantFilesGrantNothing) {
  EntitlementLimits limits;
  limits.maxGrantFiles = 3;
  for (int i = 0; i < 4; ++i) {
    writeVmap(grantFile("g" + std::to_string(i) + ".vmap"), grant(host_, {{"x", i}}));
  }
  LinuxEntitlementStore store(grants_, ::geteuid(), limits);
  Result<Dictionary> granted = store.entitlementsOfExecutable(host_);
  ASSERT_FALSE(granted.ok());
  EXPECT_TRUE(isCodesignError(granted.error(), CodesignErrorCode::TooManyGrantFiles));
  EXPECT_TRUE(store.entitlementValue(host_, "x").isNone());
  EXPECT_TRUE(anyMessageHas(capture_, "more than 3", "granting nothing"));

  ASSERT_EQ(::unlink(grantFile("g3.vmap").c_str()), 0);
  EXPECT_EQ(store.entitlementValue(host_, "x"), Value(2));
}

TEST_F(PlatformCodesignTest, OversizedGrantIsIgnoredAndMissingDirectoryGrantsNothing) {
  EntitlementLimits limits;
  limits.file.maxBytes = 200;
  writeVmap(grantFile("big.vmap"), grant(host_, {{"pad", std::string(300, 'x')}}));
  LinuxEntitlementStore store(grants_, ::geteuid(), limits);
  EXPECT_TRUE(store.entitlementValue(host_, "pad").isNone());
  EXPECT_TRUE(anyMessageHas(capture_, "big.vmap", "larger than 200"));

  LinuxEntitlementStore nowhere(scratch_ / "no/such/dir", ::geteuid());
  Result<Dictionary> granted = nowhere.entitlementsOfExecutable(host_);
  ASSERT_TRUE(granted.ok());
  EXPECT_TRUE(granted->empty());
}

TEST_F(PlatformCodesignTest, BundleEntitlementsFollowTheSameRule) {
  const std::string bundle = scratch_ / "Demo.ovx";
  writeVmap(bundle + "/Entitlements.vmap", Dictionary{{"com.corvane.net", true}});
  LinuxEntitlementStore store(grants_, ::geteuid());
  Result<Dictionary> declared = store.entitlementsOfBundle(bundle + "/");
  ASSERT_TRUE(declared.ok()) << declared.error().description();
  EXPECT_EQ(*declared, (Dictionary{{"com.corvane.net", true}}));

  ASSERT_EQ(::chmod((bundle + "/Entitlements.vmap").c_str(), 0666), 0);
  declared = store.entitlementsOfBundle(bundle);
  ASSERT_TRUE(declared.ok());
  EXPECT_TRUE(declared->empty());
  EXPECT_TRUE(anyMessageHas(capture_, "Entitlements.vmap", "writable by group and others"));

  // A link to some trusted file elsewhere is not the bundle's own file.
  ASSERT_EQ(::unlink((bundle + "/Entitlements.vmap").c_str()), 0);
  writeVmap(scratch_ / "elsewhere.vmap", Dictionary{{"stolen", true}});
  ASSERT_EQ(
      ::symlink((scratch_ / "elsewhere.vmap").c_str(), (bundle + "/Entitlements.vmap").c_str()), 0);
  declared = store.entitlementsOfBundle(bundle);
  ASSERT_TRUE(declared.ok());
  EXPECT_TRUE(declared->empty());

  ASSERT_EQ(::unlink((bundle + "/Entitlements.vmap").c_str()), 0);
  declared = store.entitlementsOfBundle(bundle);
  ASSERT_TRUE(declared.ok());
  EXPECT_TRUE(declared->empty());
  EXPECT_FALSE(store.entitlementsOfBundle(scratch_ / "Missing.ovx").ok());
  EXPECT_FALSE(store.entitlementsOfBundle("Demo.ovx").ok());
}

TEST(PlatformCodesignTrustTest, OwnerAndWriteBitsDecide) {
  struct stat status {};
  status.st_mode = S_IFREG | 0644;
  status.st_uid = 0;
  EXPECT_FALSE(distrustReason(status, 1000).has_value());
  status.st_uid = 1000;
  EXPECT_FALSE(distrustReason(status, 1000).has_value());
  status.st_uid = 1001;
  EXPECT_EQ(distrustReason(status, 1000).value_or(""),
            "owned by uid 1001, neither root nor the daemon's uid 1000");
  status.st_uid = 0;
  for (mode_t bits : {mode_t{0664}, mode_t{0646}, mode_t{0666}, mode_t{0620}, mode_t{0602}}) {
    status.st_mode = S_IFREG | bits;
    EXPECT_TRUE(distrustReason(status, 1000).has_value()) << std::oct << bits;
  }
  status.st_mode = S_IFREG | 0755;  // execute and read bits do not matter
  EXPECT_FALSE(distrustReason(status, 1000).has_value());
}

}  // namespace
}  // namespace platform::codesign
