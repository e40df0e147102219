#include <sys/stat.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "RecordTestSupport.h"
#include "platform/holvane/HolvaneError.h"
#include "platform/holvane/LinuxSdkRegistry.h"
#include "platform/root/Root.h"
#include "platform/vmap/VmapError.h"
#include "platform/vmap/Writer.h"

namespace plugin_record_test {
namespace {

using platform::holvane::HolvaneErrorCode;
using platform::holvane::isHolvaneError;
using platform::holvane::LinuxSdkRegistry;

// A temporary platform root for the test's lifetime.
class LinuxSdkRegistryTest : public RecordTest {
 protected:
  void SetUp() override {
    RecordTest::SetUp();
    std::string pattern =
        (std::filesystem::temp_directory_path() / "qv-plugin-record-XXXXXX").string();
    ASSERT_NE(::mkdtemp(pattern.data()), nullptr);
    root_ = pattern;
    previousRoot_ = platform::rootDirectory();
    platform::setRootDirectoryForTesting(root_);
    points_ = root_ + "/System/Library/ExtensionPoints";
    std::filesystem::create_directories(points_);
  }
  void TearDown() override {
    platform::setRootDirectoryForTesting(previousRoot_);
    std::error_code ignored;
    std::filesystem::remove_all(root_, ignored);
    RecordTest::TearDown();
  }

  void writeText(const std::string& name, const std::string& text) {
    std::ofstream(points_ + "/" + name, std::ios::binary | std::ios::trunc) << text;
  }
  void writeVmap(const std::string& name, const Value& value) {
    platform::Result<std::string> text = platform::vmap::write(value, platform::vmap::Format::Xml);
    ASSERT_TRUE(text.ok());
    writeText(name, *text);
  }

  std::string root_, previousRoot_, points_;
};

TEST_F(LinuxSdkRegistryTest, RefusesIdentifiersThatAreNotOneFileName) {
  writeVmap("ok.vmap", Value(Dictionary{}));
  LinuxSdkRegistry registry;
  const std::string cases[] = {"", "a/b", "..", ".hidden", std::string("ok\0x", 4),
                               std::string(251, 'a')};
  for (const std::string& identifier : cases) {
    SCOPED_TRACE(identifier);
    auto result = registry.sdkDictionary(identifier);
    ASSERT_FALSE(result.ok());
    EXPECT_TRUE(isHolvaneError(result.error(), HolvaneErrorCode::InvalidIdentifier))
        << result.error().description();
  }
  EXPECT_TRUE(registry.sdkDictionary(std::string(250, 'a')).ok());
}

TEST_F(LinuxSdkRegistryTest, AFileThatCannotBeReadIsAnError) {
  writeText("garbage.vmap", "this is not a vmap document");
  writeVmap("list.vmap", Value(Array{"not", "a", "dictionary"}));
  std::filesystem::create_directory(points_ + "/directory.vmap");
  LinuxSdkRegistry registry;

  auto garbage = registry.sdkDictionary("garbage");
  ASSERT_FALSE(garbage.ok());
  EXPECT_EQ(garbage.error().domain(), platform::vmap::kErrorDomain);

  auto list = registry.sdkDictionary("list");
  ASSERT_FALSE(list.ok());
  EXPECT_TRUE(isHolvaneError(list.error(), HolvaneErrorCode::Malformed));

  auto directory = registry.sdkDictionary("directory");
  ASSERT_FALSE(directory.ok());

  if (::geteuid() != 0) {  // root reads files whatever their mode
    writeVmap("locked.vmap", Value(Dictionary{}));
    ASSERT_EQ(::chmod((points_ + "/locked.vmap").c_str(), 0), 0);
    auto locked = registry.sdkDictionary("locked");
    ASSERT_FALSE(locked.ok());
    EXPECT_TRUE(locked.error().is(platform::kPosixErrorDomain, EACCES));
  }
}

}  // namespace
}  // namespace plugin_record_test
