#include <gtest/gtest.h>
#include <stdlib.h>

#include <filesystem>
#include <fstream>
#include <string>

#include "LogTestSupport.h"
#include "platform/log/InternalDiagnostics.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/internal/LineFormat.h"
#include "platform/log/internal/Output.h"
#include "platform/root/Root.h"

namespace platform::log {
namespace {

using internal::LineForm;

internal::LineOrigin fixedOrigin() {
  internal::LineOrigin origin;
  origin.processName = "qvd";
  origin.pid = 812;
  origin.threadId = 815;
  origin.time = {1614834367, 89'123};  // 2021-03-04T05:06:07.000089Z
  return origin;
}

std::string line(LineForm form, Level level, std::string_view sub, std::string_view cat,
                 std::string_view message) {
  return internal::renderLine(form, fixedOrigin(), level, sub, cat, message);
}

TEST(LogLine, PlainAndJournalForms) {
  EXPECT_EQ(line(LineForm::Plain, Level::Error, "com.corvane.Quorvex", "ops", "hello"),
            "2021-03-04T05:06:07.000089Z qvd[812:815] <Error> [com.corvane.Quorvex:ops] hello\n");
  EXPECT_EQ(line(LineForm::Journal, Level::Default, "com.corvane.Quorvex", "hv", "hi"),
            "<5>qvd[812:815] <Default> [com.corvane.Quorvex:hv] hi\n");
  std::string priorities;
  for (Level l : {Level::Debug, Level::Info, Level::Default, Level::Error, Level::Fault}) {
    priorities += line(LineForm::Journal, l, "s", "c", "")[1];
  }
  EXPECT_EQ(priorities, "76532");
  EXPECT_EQ(line(LineForm::Journal, Level::Info, "", "",
                 std::string_view("UTF-8 \xC3\xA9 a\nb\rc\td\\e\x1b[31m\x7f\0!", 26)),
            "<6>qvd[812:815] <Info> UTF-8 \xC3\xA9 a\\nb\\rc\\td\\\\e\\x1b[31m\\x7f\\x00!\n");
}

TEST(LogLine, JournalStreamMustNameTheDescriptor) {
  testing::TempFile file, other;
  EXPECT_TRUE(internal::isJournalStream(file.fd(), file.journalStreamValue()));
  EXPECT_FALSE(internal::isJournalStream(file.fd(), other.journalStreamValue()));
  for (const char* bad : {"", ":2", "1:2:3", "99999999999999999999999:1"})
    EXPECT_FALSE(internal::isJournalStream(file.fd(), bad)) << bad;
}

using LogOutput = testing::LogTest;

// Client text is escaped on the way out, so it cannot forge a line of its own.
TEST_F(LogOutput, WritesJournalFormWhenStderrIsTheJournal) {
  testing::TempFile file;
  internal::Output::shared().setDescriptorForTesting(file.fd());
  const Logger& l = logger("com.corvane.Quorvex", "ops");
  l.error("plain %{public}s", "ok\n2021-03-04T05:06:07.000000Z qvd[1:1] <Fault> [x:y] pwned\r");
  setenv("JOURNAL_STREAM", file.journalStreamValue().c_str(), 1);
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  l.fault("journal");
  defaultLog().notice("default");

  std::vector<std::string> lines = file.lines();
  ASSERT_EQ(lines.size(), 3u);
  EXPECT_EQ(lines[0].rfind("20", 0), 0u) << lines[0];
  EXPECT_NE(
      lines[0].find(" <Error> [com.corvane.Quorvex:ops] plain ok\\n2021-03-04T05:06:07.000000Z "
                    "qvd[1:1] <Fault> [x:y] pwned\\r"),
      std::string::npos)
      << lines[0];
  EXPECT_EQ(lines[1].rfind("<2>", 0), 0u) << lines[1];
  EXPECT_EQ(lines[2].rfind("<5>", 0), 0u) << lines[2];
  EXPECT_NE(lines[2].find("] <Default> default"), std::string::npos);
}

TEST(LogInternalDiagnostics, EmptyFileMeansAllListedMeansThoseOnly) {
  char pattern[] = "/tmp/qv-log-diag-XXXXXX";
  ASSERT_NE(mkdtemp(pattern), nullptr);
  const std::filesystem::path root = pattern;
  std::filesystem::create_directories(root / "etc/quorvex");
  const std::string savedRoot = rootDirectory();
  setRootDirectoryForTesting(root.string());
  const std::filesystem::path marker = root / kInternalDiagnosticsPath;
  auto writeMarker = [&](const std::string& text) { std::ofstream(marker, std::ios::trunc) << text; };

  EXPECT_FALSE(isInternalDiagnosticsVariant("com.corvane.Quorvex"));
  writeMarker("\n  \n\t\r\n");  // blank lines only: still empty
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.other"));
  writeMarker("com.first\n  com.corvane.Quorvex  \r\ncom.last");
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.corvane.Quorvex"));
  EXPECT_TRUE(isInternalDiagnosticsVariant("com.last"));
  EXPECT_FALSE(isInternalDiagnosticsVariant("com.corvane"));  // whole lines, not prefixes
  std::filesystem::remove(marker);
  std::filesystem::create_directory(marker);  // only a regular file counts
  EXPECT_FALSE(isInternalDiagnosticsVariant("com.corvane.Quorvex"));
  setRootDirectoryForTesting(savedRoot);
  std::filesystem::remove_all(root);
}

}  // namespace
}  // namespace platform::log
