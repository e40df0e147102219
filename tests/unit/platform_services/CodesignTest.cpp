// The entitlement store against real grant files: the trust rule, malformed
// grants, freshness and bundle entitlement files.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include "platform/codesign/CodesignError.h"
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

TEST_F(PlatformCodesignTest, OnlyTrustedWellFormedGrantsCountAndOthersAreLoggedOnce) {
  writeVmap(grantFile("others.vmap"), grant(host_, {{"others", true}}));
  writeVmap(grantFile("group.vmap"), grant(host_, {{"group", true}}));
  ASSERT_EQ(::chmod(grantFile("others.vmap").c_str(), 0646), 0);
  ASSERT_EQ(::chmod(grantFile("group.vmap").c_str(), 0664), 0);
  writeText(grantFile("garbage.vmap"), "this is not a document");
  writeVmap(grantFile("relative.vmap"), grant("bin/host", {{"x", true}}));
  writeVmap(grantFile("flat.vmap"), Dictionary{{"executable", host_}, {"entitlements", "all"}});
  ASSERT_EQ(::symlink(grantFile("good.vmap").c_str(), grantFile("link.vmap").c_str()), 0);
  const std::pair<const char*, const char*> logs[] = {
      {"others.vmap", "writable by others"}, {"group.vmap", "writable by group"},
      {"garbage.vmap", "garbage.vmap"},      {"relative.vmap", "not an absolute path"},
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
  EXPECT_FALSE(store.entitlementsOfBundle(scratch_ / "Missing.ovx").ok());
  EXPECT_FALSE(store.entitlementsOfBundle("Demo.ovx").ok());
}

}  // namespace
}  // namespace platform::codesign
