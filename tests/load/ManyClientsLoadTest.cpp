// Five hundred clients, each a process of its own, send mixed requests to
// the real daemon at once while a tenth of them are killed mid-run. The
// daemon must stay up, answer every request of every survivor exactly once
// and correctly, and give back the threads and descriptors the load took.
#include <gtest/gtest.h>
#include <signal.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <optional>
#include <sstream>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/load/ClientFleet.h"
#include "tests/load/FrameClient.h"
#include "tests/load/LoadClient.h"
#include "tests/load/LoadRoot.h"
#include "tests/load/ProcessFigures.h"

namespace qvd::load {
namespace {

using namespace std::chrono_literals;
using Clock = std::chrono::steady_clock;
using integration::Daemon;
using integration::TemporaryRoot;
using platform::Value;

constexpr int kClients = 500;
constexpr int kRequestsPerClient = 200;
constexpr int kKilled = kClients / 10;
constexpr int kPlugInsPerPoint = 12;
const std::vector<std::string> kPoints = {"com.example.load.a", "com.example.load.b",
                                          "com.example.load.c"};
// The pool retires a thread idle for 10 s; what the load grew must be gone
// well within twice that.
constexpr auto kRecoveryLimit = 20s;
static_assert(kClients <= Board::kMaxClients);

double secondsSince(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

TEST(ManyClientsLoadTest, DaemonSurvivesKilledClientsAnswersTheRestOnceAndGivesBackThreadsAndFds) {
  // The daemon inherits the limit: a descriptor per client and room to spare.
  ASSERT_TRUE(raiseDescriptorLimit(4 * kClients));
  TemporaryRoot root;
  Catalogue catalogue = writePlugIns(root, kPoints, kPlugInsPerPoint);
  // Debug lines would be about 19 KB per request here, close to 2 GB a run.
  Daemon daemon(root, {"-d", root / "annotations.vmap"}, "com.corvane.quorvex.qvd",
                integration::DaemonLogging::Info);
  ASSERT_TRUE(daemon.waitUntilServing()) << daemon.log();
  const pid_t daemonPid = childRunning(QVD_PATH);
  ASSERT_GT(daemonPid, 0);
  const std::string socketPath = root / ("run/quorvex/mbx/" + std::string(QVDServiceName));
  {
    // Every kind of request once before the baseline, so that whatever the
    // daemon opens on first use is counted in it.
    std::optional<FrameClient> client = FrameClient::connect(socketPath);
    ASSERT_TRUE(client);
    ASSERT_TRUE(resolve(*client, catalogue));
    ASSERT_TRUE(answersEveryKind(*client, catalogue));
  }
  const Figures before = settledFigures(daemonPid);
  ASSERT_GT(before.threads, 0);
  ASSERT_GT(before.fds, 0);

  Board* board = mapSharedBoard();
  ASSERT_NE(board, nullptr);
  const auto forkedAt = Clock::now();
  ClientFleet fleet(kClients, [&](int index) {
    return runClient(socketPath, catalogue, index, kRequestsPerClient, *board);
  });
  ASSERT_EQ(fleet.forked(), kClients);
  const unsigned seed = static_cast<unsigned>(Clock::now().time_since_epoch().count());
  // No victim is left so close to its end that it could finish before its kill.
  fleet.chooseVictims(kKilled, kRequestsPerClient * 9 / 10, seed);
  const auto progress = [&](int index) { return board->answered[index].load(); };

  // A client counts itself connected once its connection is queued; the
  // daemon has taken it only when it holds a descriptor for it.
  const auto connectLimit = forkedAt + 60s;
  while ((board->connected.load() < kClients || openFdCount(daemonPid) < before.fds + kClients) &&
         fleet.running() == kClients && Clock::now() < connectLimit) {
    fleet.tend(progress);
    std::this_thread::sleep_for(5ms);
  }
  const int connectedFds = openFdCount(daemonPid);
  const double connectSeconds = secondsSince(forkedAt);
  EXPECT_GE(connectedFds, before.fds + kClients)
      << "the daemon took " << connectedFds - before.fds << " of " << kClients << " connections in "
      << connectSeconds << " s";

  Figures peak{std::max(before.threads, threadCount(daemonPid)), connectedFds};
  bool daemonUp = isRunning(daemonPid);
  board->go.store(1);
  const auto start = Clock::now();
  auto lastSample = start;
  while (fleet.running() > 0 && Clock::now() - start < 150s) {
    fleet.tend(progress);
    if (Clock::now() - lastSample >= 20ms) {
      daemonUp = daemonUp && isRunning(daemonPid);
      peak.threads = std::max(peak.threads, threadCount(daemonPid));
      peak.fds = std::max(peak.fds, openFdCount(daemonPid));
      lastSample = Clock::now();
    }
    std::this_thread::sleep_for(1ms);
  }
  const double loadSeconds = secondsSince(start);
  EXPECT_EQ(fleet.running(), 0) << "clients still running after " << loadSeconds << " s";
  fleet.killAll();
  daemonUp = daemonUp && isRunning(daemonPid);
  EXPECT_TRUE(daemonUp) << "the daemon died under load";

  std::uint64_t answered = 0;
  int killedMidRun = 0, survivorsPassed = 0;
  std::ostringstream failures;
  for (int i = 0; i < kClients; ++i) {
    answered += board->answered[i].load();
    if (fleet.isVictim(i) && fleet.status(i) == 128 + SIGKILL) {
      ++killedMidRun;
    } else if (!fleet.isVictim(i) && fleet.status(i) == kClientPassed) {
      ++survivorsPassed;
    } else {
      failures << (fleet.isVictim(i) ? " victim " : " client ") << i << ": " << fleet.status(i);
    }
  }
  // Exit statuses are ClientExit values; the clients wrote their first fault to stderr.
  EXPECT_EQ(survivorsPassed, kClients - kKilled) << "exit statuses:" << failures.str();
  EXPECT_EQ(killedMidRun, kKilled) << "exit statuses:" << failures.str();
  EXPECT_GE(answered, static_cast<std::uint64_t>(kClients - kKilled) * kRequestsPerClient);

  // A newcomer is still served, and correctly.
  {
    std::optional<FrameClient> fresh = FrameClient::connect(socketPath);
    ASSERT_TRUE(fresh) << "the daemon no longer accepts connections";
    std::optional<Value> reply =
        fresh->request(Value(requestBody(RequestKind::FindByUuid, catalogue, 7, -1)), 10s);
    ASSERT_TRUE(reply) << fresh->problem();
    EXPECT_EQ(misanswer(RequestKind::FindByUuid, catalogue, 7, *reply), "");
  }

  // The load's threads retire and its descriptors close.
  const auto recoveryStart = Clock::now();
  Figures after{threadCount(daemonPid), openFdCount(daemonPid)};
  while ((after.threads > before.threads || after.fds > before.fds) &&
         Clock::now() - recoveryStart < kRecoveryLimit) {
    std::this_thread::sleep_for(100ms);
    after = {threadCount(daemonPid), openFdCount(daemonPid)};
  }
  std::printf(
      "load: %d clients x %d requests, %d killed mid-run (seed %u); forked and connected in "
      "%.1f s, then %llu requests answered in %.1f s (%.0f/s)\n"
      "daemon threads: %d before, %d peak, %d after %.1f s\n"
      "daemon fds: %d before, %d with all clients connected, %d peak, %d after\n",
      kClients, kRequestsPerClient, killedMidRun, seed, connectSeconds,
      static_cast<unsigned long long>(answered), loadSeconds,
      static_cast<double>(answered) / loadSeconds, before.threads, peak.threads, after.threads,
      secondsSince(recoveryStart), before.fds, connectedFds, peak.fds, after.fds);
  EXPECT_LE(after.threads, before.threads) << "threads left over after the load";
  EXPECT_LE(after.fds, before.fds + 2) << "descriptors left over after the load";

  EXPECT_EQ(daemon.terminate(), 0) << "the daemon did not stop cleanly after the load";
  const LogScan log = scanLog(root / "qvd.log");
  std::printf("daemon log: %llu bytes, %d fault and %d error lines%s%s",
              static_cast<unsigned long long>(log.bytes), log.faults, log.errors,
              log.firstFaultsAndErrors.empty() ? "\n" : "; first:\n",
              log.firstFaultsAndErrors.c_str());
  EXPECT_EQ(log.faults, 0);
}

}  // namespace
}  // namespace qvd::load
