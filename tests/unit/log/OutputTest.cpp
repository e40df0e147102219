#include <gtest/gtest.h>

#include <string>

#include "LogTestSupport.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/internal/LineFormat.h"
#include "platform/log/internal/Output.h"

namespace platform::log {
namespace {

using internal::LineForm;

internal::LineOrigin fixedOrigin() {
  internal::LineOrigin origin;
  origin.processName = "qvd";
  origin.pid = 812;
  origin.threadId = 815;
  origin.time.tv_sec = 1614834367;  // 2021-03-04T05:06:07Z
  origin.time.tv_nsec = 89'123;
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
  EXPECT_EQ(line(LineForm::Journal, Level::Info, "", "", "x"), "<6>qvd[812:815] <Info> x\n");
  std::string priorities;
  for (Level l : {Level::Debug, Level::Info, Level::Default, Level::Error, Level::Fault}) {
    priorities += line(LineForm::Journal, l, "s", "c", "")[1];
  }
  EXPECT_EQ(priorities, "76532");
}

TEST(LogLine, ControlCharactersAreEscaped) {
  EXPECT_EQ(line(LineForm::Journal, Level::Info, "", "",
                 std::string_view("UTF-8 \xC3\xA9 a\nb\rc\td\\e\x1b[31m\x7f\0!", 26)),
            "<6>qvd[812:815] <Info> UTF-8 \xC3\xA9 a\\nb\\rc\\td\\\\e\\x1b[31m\\x7f\\x00!\n");
}

TEST(LogLine, JournalStreamMustNameTheDescriptor) {
  testing::TempFile file;
  testing::TempFile other;
  EXPECT_TRUE(internal::isJournalStream(file.fd(), file.journalStreamValue()));
  EXPECT_FALSE(internal::isJournalStream(file.fd(), other.journalStreamValue()));
  EXPECT_FALSE(internal::isJournalStream(-1, file.journalStreamValue()));
  for (const char* bad : {"", "1:", ":2", "a:b", "1:2:3", "-1:2", "99999999999999999999999:1"}) {
    EXPECT_FALSE(internal::isJournalStream(file.fd(), bad)) << bad;
  }
}

using LogOutput = testing::LogTest;

// Client text is escaped on the way out, so it cannot forge a line of its
// own; the capture still sees it as it was.
TEST_F(LogOutput, WritesJournalFormWhenStderrIsTheJournal) {
  testing::TempFile file;
  internal::Output::shared().setDescriptorForTesting(file.fd());
  const Logger& l = logger("com.corvane.Quorvex", "ops");
  const std::string forged = "ok\n2021-03-04T05:06:07.000000Z qvd[1:1] <Fault> [x:y] pwned\r";
  {
    LogCaptureForTesting capture(CaptureEcho::AlsoStderr);
    l.error("plain %{public}s", forged);
    EXPECT_EQ(capture.messages(), std::vector<std::string>{"plain " + forged});
  }
  setenv("JOURNAL_STREAM", file.journalStreamValue().c_str(), 1);
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  l.fault("journal");
  defaultLog().notice("default");
  testing::TempFile other;  // a stream naming another file keeps the plain form
  setenv("JOURNAL_STREAM", other.journalStreamValue().c_str(), 1);
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  l.error("plain again");

  std::vector<std::string> lines = file.lines();
  ASSERT_EQ(lines.size(), 4u);
  EXPECT_EQ(lines[0].rfind("20", 0), 0u) << lines[0];
  EXPECT_NE(
      lines[0].find(" <Error> [com.corvane.Quorvex:ops] plain ok\\n2021-03-04T05:06:07.000000Z "
                    "qvd[1:1] <Fault> [x:y] pwned\\r"),
      std::string::npos)
      << lines[0];
  EXPECT_EQ(lines[1].rfind("<2>", 0), 0u) << lines[1];
  EXPECT_NE(lines[1].find("] <Fault> [com.corvane.Quorvex:ops] journal"), std::string::npos);
  EXPECT_EQ(lines[2].rfind("<5>", 0), 0u) << lines[2];
  EXPECT_NE(lines[2].find("] <Default> default"), std::string::npos);
  EXPECT_EQ(lines[3].rfind("20", 0), 0u) << lines[3];
}

}  // namespace
}  // namespace platform::log
