// Per-user containers made on disk: layout, exact modes whatever the umask,
// ownership, reuse, refused identifiers and links planted in the way.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <fstream>

#include "platform/container/ContainerError.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/root/Root.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::container {
namespace {

using services_testing::modeOf;
using services_testing::ScratchDirectory;

constexpr uid_t kUser = 65534;

uid_t ownerOf(const std::string& path) {
  struct stat status {};
  EXPECT_EQ(::lstat(path.c_str(), &status), 0) << path;
  return status.st_uid;
}

// Sets the umask for one test and puts the old one back.
class ScopedUmask {
 public:
  explicit ScopedUmask(mode_t mask) : old_(::umask(mask)) {}
  ~ScopedUmask() { ::umask(old_); }

 private:
  mode_t old_;
};

class PlatformContainerTest : public ::testing::Test {
 protected:
  ScratchDirectory scratch_;
};

TEST_F(PlatformContainerTest, MadeUnderTheRootWithExactModes) {
  for (mode_t mask : {mode_t{022}, mode_t{0277}, mode_t{0}}) {
    ScratchDirectory root;
    ScopedUmask umask(mask);
    setRootDirectoryForTesting(root.path());
    LinuxContainerManager manager;
    setRootDirectoryForTesting("/");
    Result<std::string> made = manager.userContainer(kUser, "com.corvane.clock");
    ASSERT_TRUE(made.ok()) << made.error().description();
    const std::string user = root / "var/containers/User/65534";
    EXPECT_EQ(*made, user + "/com.corvane.clock");
    EXPECT_EQ(modeOf(*made), 0700u) << std::oct << mask;
    EXPECT_EQ(modeOf(user), 0700u) << std::oct << mask;
    for (const char* shared : {"var", "var/containers", "var/containers/User"}) {
      EXPECT_EQ(modeOf(root / shared), 0711u) << shared << " umask " << std::oct << mask;
    }
    if (::geteuid() == 0) {
      EXPECT_EQ(ownerOf(*made), kUser);
      EXPECT_EQ(ownerOf(user), kUser);
      EXPECT_EQ(ownerOf(root / "var/containers/User"), 0u);
    }
  }
}

TEST_F(PlatformContainerTest, ExistingContainerIsReusedAsItIs) {
  LinuxContainerManager manager(scratch_ / "User");
  Result<std::string> first = manager.userContainer(1000, "app");
  ASSERT_TRUE(first.ok());
  std::ofstream(*first + "/data") << "kept";
  ASSERT_EQ(::chmod(first->c_str(), 0750), 0);
  Result<std::string> second = manager.userContainer(1000, "app");
  ASSERT_TRUE(second.ok());
  EXPECT_EQ(*second, *first);
  EXPECT_EQ(modeOf(*second), 0750u);
  std::ifstream in(*second + "/data");
  std::string text;
  in >> text;
  EXPECT_EQ(text, "kept");
  Result<std::string> otherUser = manager.userContainer(1001, "app");
  ASSERT_TRUE(otherUser.ok());
  EXPECT_NE(*otherUser, *first);
}

TEST_F(PlatformContainerTest, IdentifiersThatLeaveTheUsersDirectoryAreRefused) {
  LinuxContainerManager manager(scratch_ / "User");
  FakeContainerManager fake;
  for (std::string_view identifier :
       {std::string_view(""), std::string_view("."), std::string_view(".."),
        std::string_view("a/b"), std::string_view("x..y"), std::string_view("nul\0x", 5)}) {
    Result<std::string> made = manager.userContainer(1000, identifier);
    ASSERT_FALSE(made.ok()) << identifier;
    EXPECT_TRUE(isContainerError(made.error(), ContainerErrorCode::InvalidIdentifier));
    EXPECT_FALSE(fake.userContainer(1000, identifier).ok());
  }
  EXPECT_FALSE(manager.userContainer(1000, std::string(256, 'i')).ok());
  EXPECT_TRUE(manager.userContainer(1000, std::string(255, 'i')).ok());
  EXPECT_EQ(::access((scratch_ / "User/1000/a").c_str(), F_OK), -1);
}

TEST_F(PlatformContainerTest, LinksPlantedInPlaceOfDirectoriesAreRefused) {
  const std::string elsewhere = scratch_ / "elsewhere";
  services_testing::makeDirectories(elsewhere);
  ASSERT_EQ(::chmod(elsewhere.c_str(), 0755), 0);
  services_testing::makeDirectories(scratch_ / "User/1000");
  ASSERT_EQ(::symlink(elsewhere.c_str(), (scratch_ / "User/1000/app").c_str()), 0);
  ASSERT_EQ(::symlink(elsewhere.c_str(), (scratch_ / "User/1001").c_str()), 0);
  services_testing::writeText(scratch_ / "User/1000/file", "");

  LinuxContainerManager manager(scratch_ / "User");
  for (auto [uid, identifier] :
       {std::pair<uid_t, const char*>{1000, "app"}, {1001, "app"}, {1000, "file"}}) {
    Result<std::string> made = manager.userContainer(uid, identifier);
    ASSERT_FALSE(made.ok()) << uid << "/" << identifier;
    EXPECT_TRUE(isContainerError(made.error(), ContainerErrorCode::NotADirectory))
        << made.error().description();
  }
  EXPECT_EQ(modeOf(elsewhere), 0755u);
}

TEST(PlatformContainerFakeTest, NamesWithoutTouchingTheDiskAndFailsOnDemand) {
  FakeContainerManager fake("/nowhere/User");
  Result<std::string> named = fake.userContainer(501, "com.corvane.clock");
  ASSERT_TRUE(named.ok());
  EXPECT_EQ(*named, "/nowhere/User/501/com.corvane.clock");
  EXPECT_EQ(::access("/nowhere", F_OK), -1);
  fake.setFailure(Error::posix(ENOSPC, "mkdir"));
  EXPECT_FALSE(fake.userContainer(501, "x").ok());
  EXPECT_EQ(fake.requests().size(), 2u);
}

}  // namespace
}  // namespace platform::container
