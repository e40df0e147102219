// The Linux service manager against real plug-in processes: removal ends
// every running instance of the bundle and nothing else, escalates to
// SIGKILL, replies on the caller's queue only after the instances ended,
// finds an instance whose bundle was deleted through its record, and keeps
// the records of external services.
#include <errno.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>

#include <atomic>
#include <filesystem>

#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/lumend/LinuxServiceManager.h"
#include "platform/vmap/Reader.h"
#include "tests/unit/holds/HoldsTestSupport.h"
#include "tests/unit/holds/PlugInProcess.h"

namespace qvd::holds_testing {
namespace {

using namespace std::chrono_literals;
using platform::Dictionary;
using platform::lumend::LinuxServiceManager;
using platform::lumend::RemovalOutcome;
using platform::lumend::ServiceManagerOptions;

class ServiceManagerTest : public ::testing::Test {
 protected:
  // Removal looks at every process of the system, so each test uses
  // identifiers of its own: tests run side by side, and a process id is
  // reused soon enough in a long run to make it no name of its own.
  std::string id(const std::string& name) const {
    return "com.example." + name + "." + std::filesystem::path(dir_.path).filename().string();
  }
  // An executable in a bundle named `identifier` (one bundle per name).
  std::string executableOf(const std::string& identifier, const std::string& bundleName = "") {
    const std::string bundle =
        writeBundle(dir_ / ((bundleName.empty() ? identifier : bundleName) + ".ovx"), identifier);
    return installPlugInExecutable(bundle);
  }
  std::unique_ptr<PlugInProcess> start(const std::string& executable,
                                       PlugInProcess::OnTerm onTerm = PlugInProcess::OnTerm::Die) {
    return PlugInProcess::start(executable, std::nullopt, onTerm);
  }
  LinuxServiceManager manager(std::chrono::milliseconds exitGrace = 5s) {
    return LinuxServiceManager(
        ServiceManagerOptions{.recordsDirectory = dir_ / "lumend", .exitGrace = exitGrace});
  }

  TempDir dir_;
};

TEST_F(ServiceManagerTest, RemovalEndsEveryInstanceOfTheBundleAndNoOther) {
  const std::string a = executableOf(id("a"));
  // A second bundle with the same identifier counts; another identifier not.
  const std::string aCopy = executableOf(id("a"), "a-copy");
  auto first = start(a);
  auto second = start(aCopy);
  auto other = start(executableOf(id("b")));
  ASSERT_TRUE(first && second && other);

  const RemovalOutcome outcome = manager().removeNow(id("a"));
  EXPECT_EQ(outcome.error, 0);
  EXPECT_EQ(outcome.signalled, 2u);
  EXPECT_EQ(outcome.killed, 0u);
  EXPECT_EQ(outcome.survivors, 0u);
  // Ended by the time the removal returns, by SIGTERM.
  ASSERT_TRUE(first->exited());
  ASSERT_TRUE(second->exited());
  EXPECT_EQ(first->terminatingSignal(), SIGTERM);
  EXPECT_EQ(second->terminatingSignal(), SIGTERM);
  EXPECT_FALSE(other->exited(50ms)) << "another bundle's instance keeps running";
}

TEST_F(ServiceManagerTest, NothingRunningIsEsrchAndAnUnusableIdentifierEinval) {
  auto idle = start(executableOf(id("idle")));
  ASSERT_NE(idle, nullptr);
  EXPECT_EQ(manager().removeNow(id("none")).error, ESRCH);
  for (const std::string& bad :
       std::vector<std::string>{"", "a/b", ".hidden", std::string(251, 'x')}) {
    EXPECT_EQ(manager().removeNow(bad).error, EINVAL) << bad;
  }
  EXPECT_FALSE(idle->exited(20ms));
}

TEST_F(ServiceManagerTest, AnInstanceThatIgnoresSigtermIsKilledAfterTheGraceTime) {
  auto stubborn = start(executableOf(id("stubborn")), PlugInProcess::OnTerm::Ignore);
  ASSERT_NE(stubborn, nullptr);
  const auto started = std::chrono::steady_clock::now();
  const RemovalOutcome outcome = manager(200ms).removeNow(id("stubborn"));
  EXPECT_GE(std::chrono::steady_clock::now() - started, 200ms);
  EXPECT_EQ(outcome.error, 0);
  EXPECT_EQ(outcome.signalled, 1u);
  EXPECT_EQ(outcome.killed, 1u);
  EXPECT_EQ(outcome.survivors, 0u);
  ASSERT_TRUE(stubborn->exited());
  EXPECT_EQ(stubborn->terminatingSignal(), SIGKILL);
}

TEST_F(ServiceManagerTest, TheReplyRunsOnTheCallersQueueAfterTheInstancesEnded) {
  // It takes its time to end: a reply sent before it has would find it
  // still running.
  auto plugIn = start(executableOf(id("a")), PlugInProcess::OnTerm::Linger);
  ASSERT_NE(plugIn, nullptr);
  const pid_t pid = plugIn->pid();
  auto queue = platform::dispatch::SerialQueue::create("test.lumend.reply");
  platform::dispatch::Semaphore replied(0);
  std::atomic<int> error{-1};
  std::atomic<bool> onQueue{false};
  std::atomic<bool> endedBefore{false};
  manager().removeExternalService(id("a"), "7", queue, [&](int result) {
    onQueue = queue->isCurrent();
    // The process is a zombie of this test by now: waitid sees its exit
    // without reaping it.
    siginfo_t info{};
    endedBefore =
        ::waitid(P_PID, static_cast<id_t>(pid), &info, WEXITED | WNOHANG | WNOWAIT) == 0 &&
        info.si_pid == pid;
    error = result;
    replied.signal();
  });
  ASSERT_EQ(replied.waitFor(10s), platform::dispatch::WaitResult::Succeeded);
  EXPECT_EQ(error, 0);
  EXPECT_TRUE(onQueue);
  EXPECT_TRUE(endedBefore);
}

TEST_F(ServiceManagerTest, RecordsOfExternalServicesAreWrittenAndDropped) {
  const std::string executable = executableOf(id("a"));
  LinuxServiceManager lumend = manager();
  const Dictionary overlay{{"Environment", Dictionary{{"K", "V"}}}};
  ASSERT_EQ(lumend.addExternalService(::getpid(), executable, overlay), 0);
  const std::string record =
      dir_ / ("lumend/" + std::to_string(::getpid()) + "/" + id("a") + ".vmap");
  auto written = platform::vmap::readFile(record);
  ASSERT_TRUE(written.ok());
  EXPECT_EQ(*written,
            platform::Value(Dictionary{{"executable", executable}, {"overlay", overlay}}));

  // A bundle without an executable is named by its directory.
  EXPECT_EQ(lumend.addExternalService(
                ::getpid(), std::filesystem::path(executable).parent_path().string(), overlay),
            0);
  EXPECT_EQ(lumend.addExternalService(::getpid(), dir_ / "loose", overlay), EINVAL)
      << "an executable in no bundle";
  EXPECT_EQ(lumend.addExternalService(::getpid(), "relative/Plug", overlay), EINVAL);
  // A host that has exited (and been reaped) is gone.
  auto host = start(executable);
  ASSERT_NE(host, nullptr);
  const pid_t gone = host->pid();
  host.reset();
  EXPECT_EQ(lumend.addExternalService(gone, executable, overlay), ESRCH);

  const RemovalOutcome outcome = lumend.removeNow(id("a"));
  EXPECT_EQ(outcome.error, ESRCH) << "nothing ran";
  EXPECT_EQ(outcome.recordsDropped, 1u);
  EXPECT_FALSE(std::filesystem::exists(record));
}

TEST_F(ServiceManagerTest, AnInstanceWhoseBundleWasDeletedIsFoundThroughItsRecord) {
  const std::string executable = executableOf(id("gone"));
  LinuxServiceManager lumend = manager();
  ASSERT_EQ(lumend.addExternalService(::getpid(), executable, Dictionary()), 0);
  auto plugIn = start(executable);
  ASSERT_NE(plugIn, nullptr);
  std::filesystem::remove_all(dir_ / (id("gone") + ".ovx"));
  const RemovalOutcome outcome = lumend.removeNow(id("gone"));
  EXPECT_EQ(outcome.error, 0);
  EXPECT_EQ(outcome.signalled, 1u);
  ASSERT_TRUE(plugIn->exited());
  EXPECT_EQ(plugIn->terminatingSignal(), SIGTERM);
}

}  // namespace
}  // namespace qvd::holds_testing
