// The daemon's issuing functions over the recording fake.
#include <gtest/gtest.h>

#include <cerrno>
#include <filesystem>
#include <stdlib.h>
#include <string>
#include <vector>

#include "SandboxTestSupport.h"
#include "platform/sandbox/testing/FakeSandboxExtensions.h"
#include "platform/values/Array.h"
#include "qvd/QVDSandboxIssuing.h"

namespace qvd {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::sandbox::FakeSandboxExtensions;
using platform::sandbox::PathResolution;

std::string fileToken(const std::string& path) { return "fake;file;" + path; }

class SandboxIssuingTest : public ::testing::Test {
 protected:
  std::vector<platform::log::CapturedLine> linesOf(std::string_view category) {
    std::vector<platform::log::CapturedLine> lines;
    for (auto& line : capture_.lines().lines()) {
      if (line.category == category) lines.push_back(line);
    }
    return lines;
  }

  sandbox_testing::VerboseCapture capture_;
  FakeSandboxExtensions fake_;
};

TEST_F(SandboxIssuingTest, ResourceEntriesMapToTokens) {
  struct Case {
    const char* name;
    Value entries;
    const char* bundleURL;
    Dictionary expected;
  } cases[] = {
      {"whole bundle", Value(Array{"."}), "file:///Apps/A.app/PlugIns/P.ovx",
       Dictionary{{".", Value(fileToken("/Apps/A.app/PlugIns/P.ovx"))}}},
      {"number among strings", Value(Array{"a", 7, "b/c d"}), "file:///B.plugin",
       Dictionary{{"a", Value(fileToken("/B.plugin/a"))},
                  {"b/c d", Value(fileToken("/B.plugin/b/c d"))}}},
      {"escaped bundle URL", Value("x"), "file:///My%20Plug.plugin",
       Dictionary{{"x", Value(fileToken("/My Plug.plugin/x"))}}},
      {"not a list", Value(12), "file:///B.plugin", Dictionary{}},
  };
  for (const Case& c : cases) {
    FakeSandboxExtensions fake;
    const Dictionary tokens = issueResourceExtensions(fake, c.entries, c.bundleURL);
    EXPECT_EQ(tokens, c.expected) << c.name << ": " << Value(tokens).description();
    for (const auto& issued : fake.issued()) {
      EXPECT_EQ(issued.resolution, PathResolution::Canonicalise) << c.name;
    }
  }
  EXPECT_TRUE(linesOf("ops").empty());
}

TEST_F(SandboxIssuingTest, FailingEntriesAreLoggedAndSkipped) {
  fake_.failPath("/B.plugin/locked", EACCES);
  const Value entries(Array{"locked", "ok", "../outside", "/etc", "a/../../b", ""});
  const Dictionary tokens = issueResourceExtensions(fake_, entries, "file:///B.plugin");
  EXPECT_EQ(tokens, (Dictionary{{"ok", Value(fileToken("/B.plugin/ok"))},
                                {"/etc", Value(fileToken("/B.plugin/etc"))}}));
  // Entries that would leave the bundle never reach the platform.
  ASSERT_EQ(fake_.issued().size(), 2u);

  const auto lines = linesOf("ops");
  const std::vector<std::string> expected{
      "failed to make extension for /B.plugin/locked in plug-in at /B.plugin: Permission denied",
      "failed to make extension for /B.plugin/../outside in plug-in at /B.plugin: Invalid argument",
      "failed to make extension for /B.plugin/a/../../b in plug-in at /B.plugin: Invalid argument",
      "failed to make extension for /B.plugin/ in plug-in at /B.plugin: Invalid argument",
  };
  ASSERT_EQ(lines.size(), expected.size());
  for (std::size_t i = 0; i < lines.size(); ++i) {
    EXPECT_EQ(lines[i].message, expected[i]);
    EXPECT_EQ(lines[i].level, platform::log::Level::Info);
  }
}

}  // namespace
}  // namespace qvd

namespace qvd {
namespace {

TEST(SandboxIssuingLinksTest, EntriesWhoseLinksLeaveTheBundleGetNoToken) {
  char pattern[] = "/tmp/qvd-links-XXXXXX";
  const std::string dir = ::mkdtemp(pattern);
  const std::string bundle = dir + "/P.ovx";
  std::filesystem::create_directories(bundle + "/res");
  std::filesystem::create_directories(dir + "/outside");
  std::filesystem::create_symlink(dir + "/outside", bundle + "/escape");
  std::filesystem::create_symlink(bundle + "/res", bundle + "/alias");
  platform::sandbox::FakeSandboxExtensions fake;
  const platform::Dictionary tokens = issueResourceExtensions(
      fake, platform::Value(platform::Array{"res", "escape", "alias"}), "file://" + bundle);
  EXPECT_FALSE(tokens.get("res").isNone());
  EXPECT_FALSE(tokens.get("alias").isNone()) << "a link that stays inside is fine";
  EXPECT_TRUE(tokens.get("escape").isNone());
  std::filesystem::remove_all(dir);
}

}  // namespace
}  // namespace qvd
