// The real qvd binary on a temporary root, with clients in processes of
// their own: exit statuses, stopping, unidentifiable clients, request
// counting and synchronous submission.
#include <gtest/gtest.h>

#include <filesystem>
#include <fstream>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "platform/values/Dictionary.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"

namespace qvd::integration {
namespace {

using platform::Dictionary;
using platform::Value;

const std::string kUsage = "Usage: qvd [-S servicename] [-v]\n";

Dictionary request(Value name, Value version = Value(3)) {
  Dictionary d;
  d.set(QVDRequestKey, std::move(name));
  d.set(QVDVersionKey, std::move(version));
  return d;
}

TEST(DaemonCommandLineTest, UsageErrorsAndConstructionFailure) {
  struct Case {
    std::vector<std::string> arguments;
    int status;
    std::string stderrHas;
  };
  const std::vector<Case> cases = {
      {{"extra"}, 2, kUsage},
      {{"-v", "extra"}, 2, kUsage},
      {{"-c"}, 2, kUsage},
      {{"-S", "bad/name"}, 1, "unable to construct server"},
  };
  for (const Case& c : cases) {
    TemporaryRoot root;
    std::vector<std::string> argv{QVD_PATH};
    argv.insert(argv.end(), c.arguments.begin(), c.arguments.end());
    Finished finished = runProcess(argv, root.path());
    const std::string shown = ::testing::PrintToString(c.arguments);
    EXPECT_EQ(finished.status, c.status) << shown << "\n" << finished.err;
    EXPECT_NE(finished.err.find(c.stderrHas), std::string::npos) << shown << "\n" << finished.err;
    if (c.status == 2) {
      // A usage error stops before the listener exists.
      EXPECT_FALSE(std::filesystem::exists(root / "run/quorvex/mbx")) << shown;
      EXPECT_EQ(finished.err.find("unable to construct"), std::string::npos);
    }
    // A -v before the error is still reported as ineffective.
    EXPECT_EQ(finished.err.find("-v is ineffective") != std::string::npos, c.arguments[0] == "-v")
        << shown;
  }
}

TEST(DaemonLifecycleTest, ServesThenStopsOnSigterm) {
  TemporaryRoot root;
  Daemon daemon(root, {"-v", "-c", "abc", "-v", "-S", "test.lifecycle"}, "test.lifecycle");
  ASSERT_TRUE(daemon.waitUntilServing()) << daemon.log();
  EXPECT_EQ(daemon.countLines(
                "verbose option -v is ineffective; use log config --subsystem com.corvane.quorvex"),
            2);
  EXPECT_EQ(daemon.countLines("with a plug-in cache limit of 0"), 1) << daemon.log();

  ClientRun run = sendRequest(root, request("match", 1), {"--service", "test.lifecycle"});
  ASSERT_EQ(run.finished.status, 0) << run.finished.err;
  EXPECT_EQ(errorOf(run.reply),
            (std::pair<std::uint64_t, std::string>{7, "unsupported protocol version 1 (current 3)"}));

  const std::string counter = root / "run/quorvex/notify/com.corvane.quorvex.annotation-change";
  EXPECT_FALSE(std::filesystem::exists(counter));
  EXPECT_EQ(daemon.terminate(), 0) << daemon.log();
  ASSERT_TRUE(std::filesystem::exists(counter));
  std::ifstream in(counter);
  std::string posts;
  std::getline(in, posts);
  EXPECT_EQ(posts, "1") << "one notification";
  // Nobody is served after the stop.
  ClientRun late = sendRequest(root, request("match"), {"--service", "test.lifecycle"});
  EXPECT_EQ(late.finished.status, 3);
}

class DaemonRequestTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(daemon_.waitUntilServing()) << daemon_.log(); }
  void TearDown() override { EXPECT_EQ(daemon_.terminate(), 0); }
  TemporaryRoot root_;
  Daemon daemon_{root_, {}};
};

TEST_F(DaemonRequestTest, ClientWithoutAReadableExecutableIsCancelledWhileOthersAreServed) {
  ClientRun hidden;
  std::thread other([&] { hidden = sendRequest(root_, Value(request("match", 4)), {"--memfd"}); });
  ClientRun plain = sendRequest(root_, Value(request("match", 4)));
  other.join();
  EXPECT_EQ(plain.finished.status, 0) << plain.finished.err;
  EXPECT_EQ(errorOf(plain.reply).first, 7u);
  EXPECT_EQ(hidden.finished.status, 3) << hidden.finished.out;
  EXPECT_EQ(daemon_.countLines("Failed to get the file system path for the process with pid "), 1)
      << daemon_.log();
  // ...and the daemon goes on serving.
  EXPECT_EQ(errorOf(sendRequest(root_, Value(request("match", 4))).reply).first, 7u);
}

TEST_F(DaemonRequestTest, EveryThousandthRequestOfAClientIsLogged) {
  ClientRun run = sendRequest(root_, Value(request("match")), {"--count", "999"});
  ASSERT_EQ(run.finished.status, 0) << run.finished.err;
  EXPECT_EQ(daemon_.countLines("requests so far"), 0);
  run = sendRequest(root_, Value(request("match")), {"--count", "2001"});
  ASSERT_EQ(run.finished.status, 0) << run.finished.err;
  // Counted per client: the second client logs at 1000 and 2000.
  EXPECT_EQ(daemon_.countLines(" used 1000 requests so far"), 1) << daemon_.log();
  EXPECT_EQ(daemon_.countLines(" used 2000 requests so far"), 1);
  EXPECT_EQ(daemon_.countLines("requests so far"), 2);
}

TEST_F(DaemonRequestTest, SynchronousRequestsAreSubmittedSynchronously) {
  Dictionary sync = request("match", 4);
  sync.set(QVDSynchronousRequestKey, true);
  Dictionary wrongType = request("match", 4);
  wrongType.set(QVDSynchronousRequestKey, 1);
  ASSERT_EQ(sendRequest(root_, Value(sync), {"--count", "3"}).finished.status, 0);
  ASSERT_EQ(sendRequest(root_, Value(wrongType)).finished.status, 0);
  EXPECT_EQ(errorOf(sendRequest(root_, Value(request("match", 4))).reply).first, 7u);
  EXPECT_EQ(daemon_.countLines("submitting block to main queue synchronously"), 3) << daemon_.log();
}

TEST(DaemonAnnotationLocationTest, NoUserContainerStopsTheDaemon) {
  TemporaryRoot root;
  // No annotation file, and the container area is a file.
  std::filesystem::create_directories(root / "var");
  std::ofstream(root / "var/containers") << "not a directory";
  Finished finished = runProcess({QVD_PATH}, root.path());
  EXPECT_EQ(finished.status, 1);
  EXPECT_NE(finished.err.find("failed to get storage container: error="), std::string::npos)
      << finished.err;
  EXPECT_NE(finished.err.find("unable to locate user container: error "), std::string::npos);
  EXPECT_NE(finished.err.find("unable to construct server"), std::string::npos);

  // With an annotation file that loads, the container is never needed.
  const std::string file = root / "annotations.vmap";
  std::ofstream(file) << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n"
                         "<dict><key>version</key><integer>16</integer><key>data</key><dict/>"
                         "</dict>\n</vmap>\n";
  Daemon daemon(root, {"-d", file});
  ASSERT_TRUE(daemon.waitUntilServing()) << daemon.log();
  EXPECT_EQ(daemon.terminate(), 0);
}

}  // namespace
}  // namespace qvd::integration
