// Per-user containers made on disk: layout, exact modes whatever the umask,
// ownership, refused identifiers and links planted in the way.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/container/ContainerError.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/root/Root.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::container {
namespace {

using services_testing::modeOf;
using services_testing::ScratchDirectory;
using services_testing::statOf;

TEST(PlatformContainerTest, MadeUnderTheRootWithExactModesWhateverTheUmask) {
  for (mode_t mask : {mode_t{022}, mode_t{0277}, mode_t{0}}) {
    ScratchDirectory root;
    const mode_t old = ::umask(mask);
    setRootDirectoryForTesting(root.path());
    LinuxContainerManager manager;
    setRootDirectoryForTesting("/");
    Result<std::string> made = manager.userContainer(65534, "com.corvane.clock");
    ::umask(old);
    ASSERT_TRUE(made.ok()) << made.error().description();
    const std::string user = root / "var/containers/User/65534";
    EXPECT_EQ(*made, user + "/com.corvane.clock");
    EXPECT_EQ(modeOf(*made), 0700u) << std::oct << mask;
    EXPECT_EQ(modeOf(user), 0700u) << std::oct << mask;
    for (const char* shared : {"var", "var/containers", "var/containers/User"}) {
      EXPECT_EQ(modeOf(root / shared), 0711u) << shared << " umask " << std::oct << mask;
    }
    if (::geteuid() == 0) {
      EXPECT_EQ(statOf(*made).st_uid, 65534u);
      EXPECT_EQ(statOf(user).st_uid, 65534u);
      EXPECT_EQ(statOf(root / "var/containers/User").st_uid, 0u);
    }
  }
}

TEST(PlatformContainerTest, BadIdentifiersAndPlantedLinksAreRefused) {
  ScratchDirectory scratch;
  const std::string elsewhere = scratch / "elsewhere";
  services_testing::makeDirectories(elsewhere);
  ASSERT_EQ(::chmod(elsewhere.c_str(), 0755), 0);
  services_testing::makeDirectories(scratch / "User/1000");
  ASSERT_EQ(::symlink(elsewhere.c_str(), (scratch / "User/1000/app").c_str()), 0);
  ASSERT_EQ(::symlink(elsewhere.c_str(), (scratch / "User/1001").c_str()), 0);
  const struct {
    uid_t uid;
    std::string_view identifier;
    ContainerErrorCode code;
  } cases[] = {
      {1000, "", ContainerErrorCode::InvalidIdentifier},
      {1000, "..", ContainerErrorCode::InvalidIdentifier},
      {1000, "x..y", ContainerErrorCode::InvalidIdentifier},
      {1000, std::string_view("nul\0x", 5), ContainerErrorCode::InvalidIdentifier},
      {1000, "app", ContainerErrorCode::NotADirectory},   // a link to a directory
      {1001, "app", ContainerErrorCode::NotADirectory},   // the user's directory is a link
  };
  LinuxContainerManager manager(scratch / "User");
  FakeContainerManager fake;
  for (const auto& c : cases) {
    Result<std::string> made = manager.userContainer(c.uid, c.identifier);
    ASSERT_FALSE(made.ok()) << c.uid << "/" << c.identifier;
    EXPECT_TRUE(isContainerError(made.error(), c.code)) << made.error().description();
    if (c.code == ContainerErrorCode::InvalidIdentifier) {
      EXPECT_FALSE(fake.userContainer(c.uid, c.identifier).ok()) << c.identifier;
    }
  }
  EXPECT_FALSE(manager.userContainer(1000, std::string(256, 'i')).ok());
  EXPECT_TRUE(manager.userContainer(1000, std::string(255, 'i')).ok());
  EXPECT_EQ(::access((scratch / "User/1000/a").c_str(), F_OK), -1);
  EXPECT_EQ(modeOf(elsewhere), 0755u);
}

}  // namespace
}  // namespace platform::container
