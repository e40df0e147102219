#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"

namespace {

using platform::log::CaptureEcho;
using platform::log::Level;
using platform::log::LogCaptureForTesting;

TEST(QVErrorsTest, MessageBecomesTheDescription) {
  platform::Error e = QVErrorWithCodeMessage(QVErrorInvalidRequest, "invalid request format");
  EXPECT_EQ(e.domain(), "Quorvex");
  EXPECT_EQ(e.code(), 4);
  ASSERT_NE(e.localizedDescription(), nullptr);
  EXPECT_EQ(*e.localizedDescription(), "invalid request format");
  EXPECT_TRUE(QVErrorIs(e, QVErrorInvalidRequest));
  EXPECT_FALSE(QVErrorIs(e, QVErrorBadPath));
}

TEST(QVErrorsTest, FormatFillsInArgumentsWithoutRedaction) {
  platform::Value path("/Applications/A.app/PlugIns/x.ovx");
  platform::Error e = QVErrorWithCodeFormat(QVErrorBadPath, "no plug-in at path:%@", path);
  EXPECT_EQ(e.description(), "no plug-in at path:/Applications/A.app/PlugIns/x.ovx");
  platform::Error v =
      QVErrorWithCodeFormat(QVErrorVersionMismatch, "unsupported protocol version %d (current %d)",
                            1, 3);
  EXPECT_EQ(v.description(), "unsupported protocol version 1 (current 3)");
  platform::Error s =
      QVErrorWithCodeFormat(QVErrorInvalidRequest, "cannot create file extension to %@: %d",
                            std::string("/tmp/x"), 13);
  EXPECT_EQ(s.description(), "cannot create file extension to /tmp/x: 13");
}

TEST(QVLogTest, ConcurrentFirstUseGivesOneLog) {
  constexpr int kThreads = 16;
  std::atomic<bool> go{false};
  std::vector<const platform::log::Logger*> seen(kThreads);
  std::vector<std::thread> threads;
  for (int i = 0; i < kThreads; ++i) {
    threads.emplace_back([&, i] {
      while (!go.load()) std::this_thread::yield();
      seen[i] = &QVLogTraffic();
    });
  }
  go = true;
  for (auto& t : threads) t.join();
  for (auto* log : seen) EXPECT_EQ(log, seen[0]);
}

TEST(QVLogTest, FailedCreationFallsBackToTheDefaultLog) {
  LogCaptureForTesting capture(CaptureEcho::Silent);
  int calls = 0;
  const platform::log::Logger& log = qv_internal::makeCategoryLog(
      "ops", [&](std::string_view, std::string_view) -> platform::Result<const platform::log::Logger*> {
        ++calls;
        return platform::Error("test", 1, "no logs today");
      });
  EXPECT_EQ(calls, 1);
  EXPECT_EQ(&log, &platform::log::defaultLog());
  auto lines = capture.lines();
  ASSERT_EQ(lines.size(), 1u);
  EXPECT_EQ(lines[0].level, Level::Error);
  // "%s" is not marked public, so the category name is redacted in the log.
  EXPECT_EQ(lines[0].message, "unable to create tracelog for category <private>");
}

}  // namespace
