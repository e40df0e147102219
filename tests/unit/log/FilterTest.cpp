#include "platform/log/Filter.h"

#include <gtest/gtest.h>

#include <string>

#include "LogTestSupport.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"

namespace platform::log {
namespace {

constexpr std::string_view kDaemon = "com.corvane.Quorvex";

Filter parsedCleanly(std::string_view text) {
  Filter::Parsed parsed = Filter::parse(text);
  EXPECT_TRUE(parsed.problems.empty()) << text << ": " << parsed.problems.front();
  return parsed.filter;
}

TEST(LogFilter, GlobalThreshold) {
  EXPECT_EQ(parsedCleanly("").thresholdFor(kDaemon, "ops"), Threshold::Default);
  EXPECT_EQ(parsedCleanly("info").thresholdFor(kDaemon, "ops"), Threshold::Info);
  EXPECT_EQ(parsedCleanly("Info").thresholdFor("", ""), Threshold::Info);
  EXPECT_EQ(parsedCleanly("debug, error ,,").globalThreshold(), Threshold::Error);
}

TEST(LogFilter, PerCategoryAndPerLogger) {
  Filter f = parsedCleanly("info,traffic=debug");
  EXPECT_EQ(f.thresholdFor(kDaemon, "traffic"), Threshold::Debug);
  EXPECT_EQ(f.thresholdFor("com.other", "traffic"), Threshold::Debug);
  EXPECT_EQ(f.thresholdFor(kDaemon, "ops"), Threshold::Info);
  EXPECT_EQ(f.thresholdFor("", ""), Threshold::Info);  // the default log: global only

  // subsystem:category beats category alone, wherever it is written.
  f = parsedCleanly("com.corvane.Quorvex:traffic = error, traffic=debug, ops=info, ops=off");
  EXPECT_EQ(f.thresholdFor(kDaemon, "traffic"), Threshold::Error);
  EXPECT_EQ(f.thresholdFor("com.other", "traffic"), Threshold::Debug);
  EXPECT_EQ(f.thresholdFor(kDaemon, "ops"), Threshold::Off);
  EXPECT_EQ(f.thresholdFor(kDaemon, "hv"), Threshold::Default);
}

TEST(LogFilter, MalformedEntriesAreReportedAndSkipped) {
  for (const char* entry : {"verbose", "=debug", "traffic=", ":ops=info", "sub:=info", "a b=info",
                            "a=b=c", "ops=\x1b[2J", "x:y:z=info", "notice"}) {
    Filter::Parsed parsed = Filter::parse(std::string("info,") + entry + ",hv=debug");
    EXPECT_EQ(parsed.problems.size(), 1u) << entry;
    EXPECT_EQ(parsed.filter.globalThreshold(), Threshold::Info) << entry;
    EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "hv"), Threshold::Debug) << entry;
  }
  Filter::Parsed parsed = Filter::parse("traffic=loud");
  ASSERT_EQ(parsed.problems.size(), 1u);
  EXPECT_EQ(parsed.problems[0], "ignoring malformed entry \"traffic=loud\": unknown level");

  parsed = Filter::parse(std::string(200, 'n') + "=info");
  ASSERT_EQ(parsed.problems.size(), 1u);
  EXPECT_NE(parsed.problems[0].find("name too long"), std::string::npos);
  EXPECT_LT(parsed.problems[0].size(), 120u);  // the entry is quoted only in part
}

TEST(LogFilter, EntryCountAndLengthAreLimited) {
  std::string text;
  for (std::size_t i = 0; i <= Filter::kMaxEntries; ++i)
    text += std::string("c") + std::to_string(i) + "=debug,";
  Filter::Parsed parsed = Filter::parse(text);
  ASSERT_EQ(parsed.problems.size(), 1u);
  EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "c63"), Threshold::Debug);
  EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "c64"), Threshold::Default);

  // Over the byte limit: whole entries before the limit apply, the rest not.
  parsed = Filter::parse("ops=info," + std::string(Filter::kMaxTextBytes, ' ') + ",hv=debug");
  ASSERT_EQ(parsed.problems.size(), 1u);
  EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "ops"), Threshold::Info);
  EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "hv"), Threshold::Default);
}

using LogFilterRegistry = testing::LogTest;

TEST_F(LogFilterRegistry, FilterReachesExistingAndNewLoggers) {
  const Logger& existing = logger(kDaemon, "extension");
  EXPECT_FALSE(existing.isEnabled(Level::Info));
  LoggerRegistry::shared().applyFilterForTesting("error,extension=debug,filter-new=info");
  EXPECT_TRUE(existing.isEnabled(Level::Debug));
  const Logger& made = logger("com.test.filter", "filter-new");
  EXPECT_TRUE(made.isEnabled(Level::Info));
  EXPECT_FALSE(made.isEnabled(Level::Debug));
  EXPECT_FALSE(defaultLog().isEnabled(Level::Default));
  EXPECT_TRUE(defaultLog().isEnabled(Level::Error));

  setenv("QV_LOG", "off", 1);
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  EXPECT_FALSE(existing.isEnabled(Level::Fault));
  EXPECT_FALSE(defaultLog().isEnabled(Level::Fault));
}

TEST_F(LogFilterRegistry, MalformedEntriesAreReportedOnceEvenWhenAllIsOff) {
  LogCaptureForTesting capture;
  LoggerRegistry::shared().applyFilterForTesting("off,bogus,traffic=\n");
  std::vector<CapturedLine> lines = capture.lines();
  ASSERT_EQ(lines.size(), 2u);
  EXPECT_EQ(lines[0].level, Level::Error);
  EXPECT_EQ(lines[0].message, "QV_LOG: ignoring malformed entry \"bogus\": unknown level");
  EXPECT_EQ(lines[1].message, "QV_LOG: ignoring malformed entry \"traffic=\": unknown level");
  logger(kDaemon, "traffic").fault("quiet");
  EXPECT_EQ(capture.size(), 2u);
}

}  // namespace
}  // namespace platform::log
