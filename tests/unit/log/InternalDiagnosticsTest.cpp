#include "platform/log/InternalDiagnostics.h"

#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "platform/root/Root.h"

namespace platform::log {
namespace {

constexpr std::string_view kDaemon = "com.corvane.Quorvex";

// A private platform root holding etc/quorvex/.
class LogInternalDiagnostics : public ::testing::Test {
 protected:
  void SetUp() override {
    char pattern[] = "/tmp/qv-log-diag-XXXXXX";
    ASSERT_NE(mkdtemp(pattern), nullptr);
    root_ = pattern;
    std::filesystem::create_directories(root_ / "etc/quorvex");
    savedRoot_ = rootDirectory();
    setRootDirectoryForTesting(root_.string());
  }
  void TearDown() override {
    setRootDirectoryForTesting(savedRoot_);
    setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride::None);
    std::filesystem::remove_all(root_);
  }

  std::filesystem::path marker() const { return root_ / kInternalDiagnosticsPath; }
  void writeMarker(const std::string& contents) const {
    std::ofstream(marker(), std::ios::binary | std::ios::trunc) << contents;
  }

  std::filesystem::path root_;
  std::string savedRoot_;
};

TEST_F(LogInternalDiagnostics, MissingOrEmptyFile) {
  EXPECT_FALSE(isInternalDiagnosticsVariant(kDaemon));
  writeMarker("");
  EXPECT_TRUE(isInternalDiagnosticsVariant(kDaemon));
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.other"));
  writeMarker("\n  \n\t\r\n");  // blank lines only: still empty
  EXPECT_TRUE(isInternalDiagnosticsVariant(kDaemon));
}

TEST_F(LogInternalDiagnostics, ListedSubsystemsOnly) {
  writeMarker("com.first\n  com.corvane.Quorvex  \r\ncom.last");
  EXPECT_TRUE(isInternalDiagnosticsVariant(kDaemon));
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.first"));
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.last"));
  EXPECT_FALSE(isInternalDiagnosticsVariant("com.corvane"));  // whole lines, not prefixes
  EXPECT_FALSE(isInternalDiagnosticsVariant("com.corvane.Quorvex.extra"));
  EXPECT_FALSE(isInternalDiagnosticsVariant(""));
}

TEST_F(LogInternalDiagnostics, OnlyARegularFileOfBoundedSizeCounts) {
  std::filesystem::create_directory(marker());
  EXPECT_FALSE(isInternalDiagnosticsVariant(kDaemon));
  std::filesystem::remove(marker());
  writeMarker(std::string(kMaxInternalDiagnosticsBytes, '\n'));
  EXPECT_TRUE(isInternalDiagnosticsVariant(kDaemon));
  writeMarker(std::string(kMaxInternalDiagnosticsBytes + 1, '\n'));
  EXPECT_FALSE(isInternalDiagnosticsVariant(kDaemon));
}

TEST_F(LogInternalDiagnostics, OverrideForTesting) {
  setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride::Enabled);
  EXPECT_TRUE(isInternalDiagnosticsVariant(kDaemon));
  writeMarker("com.other\n");
  setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride::Disabled);
  EXPECT_FALSE(isInternalDiagnosticsVariant("com.other"));
  setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride::None);
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.other"));
}

}  // namespace
}  // namespace platform::log
