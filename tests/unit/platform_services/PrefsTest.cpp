// Preferences read from real files: values, re-reading after edits the
// cache could miss, missing and malformed files, refused domain names.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <filesystem>
#include <thread>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/prefs/LinuxPreferenceStore.h"
#include "platform/prefs/testing/FakePreferenceStore.h"
#include "platform/root/Root.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::prefs {
namespace {

using services_testing::inodeOf;
using services_testing::ScratchDirectory;
using services_testing::vmapText;
using services_testing::writeText;
using services_testing::writeVmap;

struct timespec mtimeOf(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(::stat(path.c_str(), &status), 0);
  return status.st_mtim;
}

void setMtime(const std::string& path, struct timespec mtime) {
  const struct timespec times[2] = {{0, UTIME_OMIT}, mtime};
  ASSERT_EQ(::utimensat(AT_FDCWD, path.c_str(), times, 0), 0);
}

class PlatformPrefsTest : public ::testing::Test {
 protected:
  void SetUp() override { directory_ = scratch_ / "etc/quorvex/preferences"; }
  std::string file(const std::string& domain) const { return directory_ + "/" + domain + ".vmap"; }

  // Waits out the window in which the store re-reads every file anyway, so
  // that only its signature check decides.
  static void waitPastRecentWindow() {
    std::this_thread::sleep_for(std::chrono::milliseconds(2100));
  }

  ScratchDirectory scratch_;
  std::string directory_;
  log::LogCaptureForTesting capture_;
};

TEST_F(PlatformPrefsTest, ReadsValuesUnderTheRoot) {
  writeVmap(file("com.corvane.qvd"), Dictionary{{"ScanInterval", 30}, {"Verbose", true}});
  setRootDirectoryForTesting(scratch_.path());
  LinuxPreferenceStore store;  // finds <root>/etc/quorvex/preferences
  setRootDirectoryForTesting("/");
  EXPECT_EQ(store.valueForKey("com.corvane.qvd", "ScanInterval"), Value(30));
  EXPECT_EQ(store.valueForKey("com.corvane.qvd", "Verbose"), Value(true));
  EXPECT_TRUE(store.valueForKey("com.corvane.qvd", "Absent").isNone());
  EXPECT_TRUE(store.valueForKey("com.corvane.other", "ScanInterval").isNone());
}

TEST_F(PlatformPrefsTest, SameSizeRewriteWithTouchedMtimeIsRead) {
  const std::string path = file("d");
  writeVmap(path, Dictionary{{"k", "aaaa"}});
  waitPastRecentWindow();
  LinuxPreferenceStore store(directory_);
  EXPECT_EQ(store.valueForKey("d", "k"), Value("aaaa"));
  EXPECT_EQ(store.valueForKey("d", "k"), Value("aaaa"));
  EXPECT_EQ(store.readsForTesting("d"), 1u);  // the second answer came from the cache

  const ino_t inode = inodeOf(path);
  const auto size = std::filesystem::file_size(path);
  struct timespec mtime = mtimeOf(path);
  writeText(path, vmapText(Dictionary{{"k", "bbbb"}}));
  mtime.tv_sec += 1;  // touched: only the mtime tells this edit apart
  setMtime(path, mtime);
  ASSERT_EQ(inodeOf(path), inode);
  ASSERT_EQ(std::filesystem::file_size(path), size);
  EXPECT_EQ(store.valueForKey("d", "k"), Value("bbbb"));
  EXPECT_EQ(store.readsForTesting("d"), 2u);
}

TEST_F(PlatformPrefsTest, RewriteThatRestoresTheMtimeIsStillRead) {
  // Same inode, size and mtime: only the change time gives the edit away.
  const std::string path = file("d");
  writeVmap(path, Dictionary{{"k", "aaaa"}});
  waitPastRecentWindow();
  LinuxPreferenceStore store(directory_);
  EXPECT_EQ(store.valueForKey("d", "k"), Value("aaaa"));
  const struct timespec mtime = mtimeOf(path);
  writeText(path, vmapText(Dictionary{{"k", "cccc"}}));
  setMtime(path, mtime);
  EXPECT_EQ(store.valueForKey("d", "k"), Value("cccc"));
}

TEST_F(PlatformPrefsTest, MissingFileGivesNoneUntilItAppears) {
  LinuxPreferenceStore store(directory_);
  EXPECT_TRUE(store.valueForKey("late", "k").isNone());
  writeVmap(file("late"), Dictionary{{"k", 1}});
  EXPECT_EQ(store.valueForKey("late", "k"), Value(1));
  ASSERT_EQ(::unlink(file("late").c_str()), 0);
  EXPECT_TRUE(store.valueForKey("late", "k").isNone());
  EXPECT_EQ(capture_.size(), 0u);  // a missing file is not a fault
}

TEST_F(PlatformPrefsTest, MalformedFileGivesNoneAndIsLoggedOncePerChange) {
  LinuxPreferenceStore store(directory_);
  writeText(file("bad"), "<vmap version=\"1.0\"><dict><key>k</key></dict></vmap>");
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(store.valueForKey("bad", "k").isNone());
  EXPECT_EQ(capture_.size(), 1u);

  writeVmap(file("bad"), Value(Array{Value(1)}));  // reads, but is no dictionary
  for (int i = 0; i < 3; ++i) EXPECT_TRUE(store.valueForKey("bad", "k").isNone());
  ASSERT_EQ(capture_.size(), 2u);
  EXPECT_NE(capture_.messages()[1].find("not a dictionary"), std::string::npos);

  writeVmap(file("bad"), Dictionary{{"k", "fixed"}});
  EXPECT_EQ(store.valueForKey("bad", "k"), Value("fixed"));
  EXPECT_EQ(capture_.size(), 2u);
}

TEST_F(PlatformPrefsTest, DomainNamesThatLeaveTheDirectoryAreRefused) {
  // Files that a refused name would reach exist, so only the refusal can
  // answer none.
  writeVmap(scratch_ / "etc/quorvex/escape.vmap", Dictionary{{"k", 1}});
  writeVmap(file("..hidden"), Dictionary{{"k", 1}});
  writeVmap(file("a/b"), Dictionary{{"k", 1}});
  LinuxPreferenceStore store(directory_);
  for (std::string_view domain :
       {std::string_view("../escape"), std::string_view("..hidden"), std::string_view("a/b"),
        std::string_view(""), std::string_view("x\0y", 3)}) {
    EXPECT_TRUE(store.valueForKey(domain, "k").isNone()) << domain;
  }
  FakePreferenceStore fake;
  fake.setValue("..hidden", "k", 1);
  EXPECT_TRUE(fake.valueForKey("..hidden", "k").isNone());
}

}  // namespace
}  // namespace platform::prefs
