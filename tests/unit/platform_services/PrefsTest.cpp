// Preferences read from real files: values, re-reading after edits the
// cache could miss, missing and malformed files, refused domain names.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <chrono>
#include <thread>

#include "platform/log/LogCaptureForTesting.h"
#include "platform/prefs/LinuxPreferenceStore.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::prefs {
namespace {

using services_testing::statOf;
using services_testing::writeText;
using services_testing::writeVmap;

class PlatformPrefsTest : public ::testing::Test {
 protected:
  std::string file(const std::string& domain) const { return directory_ + "/" + domain + ".vmap"; }
  services_testing::ScratchDirectory scratch_;
  const std::string directory_ = scratch_ / "etc/quorvex/preferences";
  log::LogCaptureForTesting capture_;
};

TEST_F(PlatformPrefsTest, SameSizeRewriteIsRead) {
  // Same inode and size; "touched" moves the mtime on, "restored" puts it
  // back, so that only the change time gives the edit away.
  const struct {
    const char* domain;
    long mtimeStep;
  } cases[] = {{"touched", 1}, {"restored", 0}};
  for (const auto& c : cases) writeVmap(file(c.domain), Dictionary{{"k", "aaaa"}});
  // Past the window in which the store re-reads every file anyway.
  std::this_thread::sleep_for(std::chrono::milliseconds(2100));
  LinuxPreferenceStore store(directory_);
  for (const auto& c : cases) {
    EXPECT_EQ(store.valueForKey(c.domain, "k"), Value("aaaa"));
    EXPECT_EQ(store.valueForKey(c.domain, "k"), Value("aaaa"));
    EXPECT_EQ(store.readsForTesting(c.domain), 1u) << c.domain;  // the second from the cache

    const struct stat before = statOf(file(c.domain));
    writeText(file(c.domain), services_testing::vmapText(Dictionary{{"k", "bbbb"}}));
    const struct timespec times[2] = {
        {0, UTIME_OMIT}, {before.st_mtim.tv_sec + c.mtimeStep, before.st_mtim.tv_nsec}};
    ASSERT_EQ(::utimensat(AT_FDCWD, file(c.domain).c_str(), times, 0), 0);
    const struct stat after = statOf(file(c.domain));
    ASSERT_EQ(after.st_ino, before.st_ino);
    ASSERT_EQ(after.st_size, before.st_size);
    EXPECT_EQ(store.valueForKey(c.domain, "k"), Value("bbbb")) << c.domain;
    EXPECT_EQ(store.readsForTesting(c.domain), 2u) << c.domain;
  }
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
  for (std::string_view domain : {std::string_view("../escape"), std::string_view("..hidden"),
                                  std::string_view("a/b"), std::string_view(""),
                                  std::string_view("x\0y", 3)}) {
    EXPECT_TRUE(store.valueForKey(domain, "k").isNone()) << domain;
  }
}

}  // namespace
}  // namespace platform::prefs
