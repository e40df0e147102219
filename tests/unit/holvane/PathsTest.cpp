// How bundle paths are stored and quoted: canonical without a trailing
// separator (also for a bundle already deleted), and as file URLs.
#include <gtest/gtest.h>

#include <filesystem>

#include "platform/holvane/internal/RecordBuilder.h"
#include "tests/unit/holvane/HolvaneTestSupport.h"

namespace platform::holvane::internal {
namespace {

TEST(PathsTest, CanonicalBundlePaths) {
  testing::SystemRoot root;
  std::filesystem::create_directories(root / "real/B.ovx");
  std::filesystem::create_symlink(root / "real", root / "link");
  struct Case {
    std::string given;
    std::optional<std::string> expected;
  };
  const Case cases[] = {
      {root / "real/B.ovx", root / "real/B.ovx"},
      {root / "link/B.ovx", root / "real/B.ovx"},
      {root / "link/./B.ovx/", root / "real/B.ovx"},
      // Gone: the parent is resolved, the name kept, so a deleted bundle
      // can still be unregistered by the path it was registered under.
      {root / "link/Gone.ovx", root / "real/Gone.ovx"},
      {root / "nowhere/Gone.ovx", std::nullopt},
      {"relative/B.ovx", std::nullopt},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(canonicalBundlePath(c.given), c.expected) << c.given;
  }
}

TEST(PathsTest, FileUrls) {
  struct Case {
    const char* path;
    const char* url;
  };
  const Case cases[] = {
      {"/A/B.ovx/Info.vmap", "file:///A/B.ovx/Info.vmap"},
      {"/My Apps/W%1.ovx", "file:///My%20Apps/W%251.ovx"},
      {"/x/\xC3\xA9t\xC3\xA9?#", "file:///x/%C3%A9t%C3%A9%3F%23"},
  };
  for (const Case& c : cases) EXPECT_EQ(fileUrl(c.path), c.url) << c.path;
}

}  // namespace
}  // namespace platform::holvane::internal
