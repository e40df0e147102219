// The daemon killed (SIGKILL) at random moments while a client annotates
// as fast as it is answered: after every restart the annotation file loads
// and each plug-in shows its last acknowledged change, or the one that was
// in flight when the daemon died, never anything older.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <map>
#include <optional>
#include <random>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"

namespace qvd::durability {
namespace {

using integration::Daemon;
using integration::TemporaryRoot;
using platform::Dictionary;
using platform::Value;
using namespace std::chrono_literals;

constexpr int kPlugIns = 8;
constexpr long kAcknowledged = 1000;  // changes to see acknowledged in all

// The annotate loop, started with its output in `out`; its pid.
pid_t startLoop(const TemporaryRoot& root, long first, long count,
                const std::vector<std::string>& uuids, const std::string& out) {
  std::vector<std::string> args{ANNOTATE_LOOP_PATH, std::to_string(first), std::to_string(count)};
  args.insert(args.end(), uuids.begin(), uuids.end());
  const std::string rootVariable = "QV_ROOT=" + root.path();
  const pid_t pid = ::fork();
  if (pid == 0) {
    const int fd = ::open(out.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0 || ::dup2(fd, STDOUT_FILENO) < 0) ::_exit(127);
    std::vector<char*> argv;
    for (std::string& arg : args) argv.push_back(arg.data());
    argv.push_back(nullptr);
    char* envp[] = {const_cast<char*>(rootVariable.c_str()), const_cast<char*>("QV_LOG=error"),
                    nullptr};
    ::execve(argv[0], argv.data(), envp);
    ::_exit(127);
  }
  return pid;
}

// What one run of the loop reported: the steps acknowledged, and the one
// sent without an answer, if any.
struct LoopReport {
  std::vector<long> acknowledged;
  std::optional<long> inFlight;
};

LoopReport readReport(const std::string& out) {
  LoopReport report;
  std::ifstream lines(out);
  std::string word;
  long step = 0;
  while (lines >> word >> step) {
    if (word == "sent") report.inFlight = step;
    if (word == "ack") {
      report.acknowledged.push_back(step);
      report.inFlight.reset();
    }
  }
  return report;
}

// Returns once the loop writing to `out` has had `answers` requests
// answered, or has ended, or after 10 s.
void waitForAnswers(const std::string& out, pid_t loop, long answers) {
  const auto deadline = std::chrono::steady_clock::now() + 10s;
  while (std::chrono::steady_clock::now() < deadline) {
    if (static_cast<long>(readReport(out).acknowledged.size()) >= answers) return;
    siginfo_t info{};
    // Ended, but left for the caller to reap.
    if (::waitid(P_PID, static_cast<id_t>(loop), &info, WEXITED | WNOHANG | WNOWAIT) == 0 &&
        info.si_pid == loop) {
      return;
    }
    std::this_thread::sleep_for(200us);
  }
}

class CrashDurabilityTest : public ::testing::Test {
 protected:
  std::string annotationFile() const { return root_ / "annotations.vmap"; }
  void start() {
    daemon_.emplace(root_, std::vector<std::string>{"-d", annotationFile()});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
  }
  Dictionary formAt(const std::string& path) {
    integration::ClientRun run = integration::sendRequest(
        root_, Dictionary{{std::string(QVDRequestKey), std::string(QVDFindRequest)},
                          {std::string(QVDVersionKey), 3},
                          {std::string(QVDPathsKey), "file://" + path}});
    const Dictionary* body = run.reply.dictionary();
    const Dictionary* form = body ? body->get(QVDMatchesKey).dictionary() : nullptr;
    return form ? *form : Dictionary();
  }
  // The step stored for the plug-in at `path`, or -1 without one.
  long storedStep(const std::string& path) {
    const Dictionary form = formAt(path);
    const Dictionary* notes = form.get(QVAnnotationsFormKey).dictionary();
    const Dictionary* extension = notes ? notes->get("extension").dictionary() : nullptr;
    const std::optional<std::int64_t> step =
        extension ? extension->get("step").int64() : std::nullopt;
    return step ? static_cast<long>(*step) : -1;
  }

  TemporaryRoot root_;
  std::optional<Daemon> daemon_;
};

TEST_F(CrashDurabilityTest, AcknowledgedAnnotationsSurviveSigkill) {
  std::vector<std::string> paths;
  for (int i = 0; i < kPlugIns; ++i) {
    paths.push_back(integration::writeSystemPlugIn(root_, "p" + std::to_string(i)));
  }
  start();
  std::vector<std::string> uuids;
  for (const std::string& path : paths) {
    const Dictionary form = formAt(path);
    const std::string* uuid = form.get(QVFormUUIDKey).string();
    ASSERT_NE(uuid, nullptr) << path;
    uuids.push_back(*uuid);
  }

  std::mt19937 random(std::random_device{}());
  // Per plug-in: the last acknowledged step, and one that may have landed.
  std::vector<long> lastAck(kPlugIns, -1);
  std::vector<std::optional<long>> maybe(kPlugIns);
  long next = 0;
  long acknowledged = 0;
  int kills = 0;
  while (acknowledged < kAcknowledged) {
    const std::string out = root_ / ("loop-" + std::to_string(kills) + ".out");
    const pid_t loop = startLoop(root_, next, kAcknowledged - acknowledged, uuids, out);
    ASSERT_GT(loop, 0);
    // After a random number of answers (a fixed share of the whole, however
    // fast the machine is), then a random moment within the next request.
    waitForAnswers(out, loop, static_cast<long>(random() % 80));
    std::this_thread::sleep_for(std::chrono::microseconds(random() % 2000));
    daemon_->kill();
    ++kills;
    int status = 0;
    ASSERT_EQ(::waitpid(loop, &status, 0), loop);
    ASSERT_TRUE(WIFEXITED(status) && (WEXITSTATUS(status) == 0 || WEXITSTATUS(status) == 3))
        << "annotate loop status " << status;

    const LoopReport report = readReport(out);
    for (long step : report.acknowledged) {
      lastAck[static_cast<std::size_t>(step % kPlugIns)] = step;
      maybe[static_cast<std::size_t>(step % kPlugIns)].reset();
    }
    if (report.inFlight)
      maybe[static_cast<std::size_t>(*report.inFlight % kPlugIns)] = *report.inFlight;
    acknowledged += static_cast<long>(report.acknowledged.size());
    next = report.inFlight ? *report.inFlight + 1
                           : (report.acknowledged.empty() ? next : report.acknowledged.back() + 1);

    start();
    EXPECT_EQ(daemon_->countLines("unable to load annotation database"), 0) << daemon_->log();
    for (int i = 0; i < kPlugIns; ++i) {
      const long stored = storedStep(paths[static_cast<std::size_t>(i)]);
      const bool expected =
          stored == lastAck[static_cast<std::size_t>(i)] ||
          (maybe[static_cast<std::size_t>(i)] && stored == *maybe[static_cast<std::size_t>(i)]);
      ASSERT_TRUE(expected) << "plug-in " << i << " holds step " << stored << ", acknowledged "
                            << lastAck[static_cast<std::size_t>(i)] << " after kill " << kills;
      // What is stored is now the truth to build on.
      lastAck[static_cast<std::size_t>(i)] = stored;
      maybe[static_cast<std::size_t>(i)].reset();
    }
  }
  EXPECT_GE(kills, 5) << "too few kills to say anything";
  RecordProperty("kills", kills);
  std::printf("%ld changes acknowledged across %d kills\n", acknowledged, kills);
  EXPECT_EQ(daemon_->terminate(), 0);
  daemon_.reset();
}

}  // namespace
}  // namespace qvd::durability
