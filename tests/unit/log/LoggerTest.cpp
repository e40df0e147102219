#include "platform/log/Filter.h"
#include "platform/log/Logger.h"

#include <gtest/gtest.h>

#include <latch>
#include <regex>
#include <set>
#include <string>
#include <thread>
#include <vector>

#include "LogTestSupport.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/SignpostInterval.h"
#include "platform/log/LoggerRegistry.h"

namespace platform::log {
namespace {

constexpr std::string_view kDaemon = "com.corvane.Quorvex";

using LogLogger = testing::LogTest;
using testing::Counted;

TEST_F(LogLogger, NamesAreCheckedAndEachPairHasOneLogger) {
  const std::pair<std::string, LoggerError> bad[] = {
      {"", LoggerError::EmptyName},
      {std::string(129, 's'), LoggerError::NameTooLong},
      {"caf\xC3\xA9", LoggerError::InvalidCharacter},
  };
  for (const auto& [name, error] : bad) {
    for (auto [subsystem, category] : {std::pair{name, std::string("ops")}, {"com.x", name}}) {
      Result<const Logger*> made = LoggerRegistry::shared().logger(subsystem, category);
      ASSERT_FALSE(made.ok()) << subsystem << "/" << category;
      EXPECT_EQ(made.error().domain(), kLoggerErrorDomain);
      EXPECT_EQ(made.error().code(), static_cast<std::int64_t>(error));
    }
  }
  EXPECT_EQ(LoggerRegistry::shared().logger("com.x", "new\nline").error().description(),
            "invalid character in name for logger (com.x, new\\nline)");

  EXPECT_EQ(&logger(kDaemon, "ops"), &logger(kDaemon, "ops"));
  EXPECT_NE(&logger(kDaemon, "ops"), &logger("com.other", "ops"));
}

// Below the threshold nothing is formatted: the argument is never described.
TEST_F(LogLogger, DisabledLevelBuildsNoMessage) {
  const Logger& l = logger(kDaemon, "hv");
  Counted counted;
  LogCaptureForTesting capture;
  l.debug("%{public}@", counted);
  EXPECT_EQ(counted.calls.load(), 0);
  l.notice("n %{public}@", counted);
  l.log(Level::Fault, "f");
  EXPECT_EQ(counted.calls.load(), 1);
  LoggerRegistry::shared().applyFilterForTesting("hv=debug");
  l.debug("%{public}@", counted);
  EXPECT_EQ(counted.calls.load(), 2);
  std::vector<CapturedLine> lines = capture.lines();
  ASSERT_EQ(lines.size(), 3u);
  EXPECT_EQ(lines[0].message, "n counted");
  EXPECT_EQ(lines[1].level, Level::Fault);
}

// An interval opened while debug is off stays silent even if debug comes on
// before it closes: no end line without its begin.
TEST_F(LogLogger, SignpostIntervalsLogBeginAndEndOnlyWhenDebugIsOn) {
  const Logger& l = logger(kDaemon, "signposts");
  LogCaptureForTesting capture;
  {
    SignpostInterval quiet(l, "Quiet");
    LoggerRegistry::shared().applyFilterForTesting("signposts=debug");
  }
  EXPECT_EQ(capture.size(), 0u);
  { SignpostInterval traced(l, "Traced"); }
  std::vector<std::string> messages = capture.messages();
  ASSERT_EQ(messages.size(), 2u);
  EXPECT_EQ(messages[0], "signpost begin Traced");
  EXPECT_EQ(messages[1].rfind("signpost end Traced after ", 0), 0u) << messages[1];
  EXPECT_EQ(messages[1].substr(messages[1].size() - 3), " us");
}

TEST_F(LogLogger, LinesAreRedactedUnlessQvLogPrivateIsOne) {
  const Logger& l = logger(kDaemon, "sandbox");
  LogCaptureForTesting capture;
  l.notice("open %s (%{public}s) %d", "/secret", "public", 3);
  setenv("QV_LOG_PRIVATE", "1", 1);
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  l.notice("open %s", "/secret");
  setenv("QV_LOG_PRIVATE", "yes", 1);  // only "1" counts
  LoggerRegistry::shared().reloadEnvironmentForTesting();
  l.notice("open %s", "/secret");
  EXPECT_EQ(capture.messages(), (std::vector<std::string>{"open <private> (public) 3",
                                                          "open /secret", "open <private>"}));
}

TEST_F(LogLogger, ConcurrentFirstCreationGivesOneLogger) {
  constexpr int kThreads = 16;
  for (int round = 0; round < 20; ++round) {
    std::string category = std::string("race") + std::to_string(round);
    std::latch start(kThreads);
    std::vector<const Logger*> seen(kThreads, nullptr);
    std::vector<std::jthread> threads;
    for (int t = 0; t < kThreads; ++t)
      threads.emplace_back([&, t] {
        start.arrive_and_wait();
        seen[t] = LoggerRegistry::shared().logger("com.test.race", category).valueOr(nullptr);
      });
    threads.clear();
    std::set<const Logger*> distinct(seen.begin(), seen.end());
    ASSERT_EQ(distinct.size(), 1u) << category;
    ASSERT_NE(*distinct.begin(), nullptr);
  }
}

// Whole lines in the output file prove each line is one write(2).
TEST_F(LogLogger, ConcurrentLoggingWritesWholeLines) {
  constexpr int kThreads = 8;
  constexpr int kLines = 1000;
  testing::TempFile file;
  internal::Output::shared().setDescriptorForTesting(file.fd());
  const std::string payload(300, 'p');
  std::latch start(kThreads);
  std::vector<std::jthread> threads;
  for (int t = 0; t < kThreads; ++t)
    threads.emplace_back([&, t] {
      const Logger& l = logger("com.test.lines", std::string("c") + std::to_string(t));
      start.arrive_and_wait();
      for (int i = 0; i < kLines; ++i) l.error("%d:%d %{public}s end", t, i, payload);
    });
  threads.clear();

  std::vector<std::string> lines = file.lines();
  ASSERT_EQ(lines.size(), static_cast<std::size_t>(kThreads * kLines));
  const std::regex shape(R"(\d{4}-\d\d-\d\dT\d\d:\d\d:\d\d\.\d{6}Z [^\[]+\[\d+:\d+\] <Error> )"
                         R"(\[com\.test\.lines:c(\d+)\] \1:(\d+) p{300} end)");
  std::set<std::pair<int, int>> seen;
  for (const std::string& line : lines) {
    std::smatch m;
    ASSERT_TRUE(std::regex_match(line, m, shape)) << line;
    seen.emplace(std::stoi(m[1]), std::stoi(m[2]));
  }
  EXPECT_EQ(seen.size(), static_cast<std::size_t>(kThreads * kLines));
}

Filter parsedCleanly(std::string_view text) {
  Filter::Parsed parsed = Filter::parse(text);
  EXPECT_TRUE(parsed.problems.empty()) << text << ": " << parsed.problems.front();
  return parsed.filter;
}

TEST(LogFilter, PerCategoryAndPerLogger) {
  Filter f = parsedCleanly("info,traffic=debug");
  EXPECT_EQ(f.thresholdFor(kDaemon, "traffic"), Threshold::Debug);
  EXPECT_EQ(f.thresholdFor("", ""), Threshold::Info);  // the default log: global only

  // subsystem:category beats category alone, wherever it is written.
  f = parsedCleanly("com.corvane.Quorvex:traffic = error, traffic=debug, ops=info, ops=off");
  EXPECT_EQ(f.thresholdFor(kDaemon, "traffic"), Threshold::Error);
  EXPECT_EQ(f.thresholdFor("com.other", "traffic"), Threshold::Debug);
  EXPECT_EQ(f.thresholdFor(kDaemon, "ops"), Threshold::Off);
  EXPECT_EQ(f.thresholdFor(kDaemon, "hv"), Threshold::Default);
}

TEST(LogFilter, MalformedEntriesAreReportedAndSkipped) {
  for (const char* entry : {"verbose", "=debug", "sub:=info", "a=b=c", "x:y:z=info"}) {
    Filter::Parsed parsed = Filter::parse(std::string("info,") + entry + ",hv=debug");
    EXPECT_EQ(parsed.problems.size(), 1u) << entry;
    EXPECT_EQ(parsed.filter.globalThreshold(), Threshold::Info) << entry;
    EXPECT_EQ(parsed.filter.thresholdFor(kDaemon, "hv"), Threshold::Debug) << entry;
  }
}

TEST_F(LogLogger, MalformedEntriesAreReportedOnceEvenWhenAllIsOff) {
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
