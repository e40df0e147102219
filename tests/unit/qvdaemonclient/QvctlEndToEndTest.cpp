// qvctl against a fake daemon: in process through runQvctl, and twice as
// the real binary, for the exit statuses and what reaches stdout and stderr.
#include <gtest/gtest.h>
#include <sys/wait.h>

#include <cstdlib>
#include <fstream>
#include <sstream>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "platform/notify/testing/FakeNotificationCenter.h"
#include "tests/unit/mbx/MbxTestSupport.h"
#include "tests/unit/qvdaemonclient/FakeDaemon.h"
#include "tools/qvctl/Qvctl.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using platform::mbx::testing::eventually;

struct ToolRun {
  int status = -1;
  std::string out;
  std::string err;
};

class QvctlEndToEnd : public ::testing::Test {
 protected:
  ToolRun run(std::vector<std::string_view> args,
              std::shared_ptr<platform::notify::NotificationCenter> center = nullptr) {
    char* outText = nullptr;
    char* errText = nullptr;
    std::size_t outSize = 0;
    std::size_t errSize = 0;
    qvctl::Environment environment;
    environment.out = open_memstream(&outText, &outSize);
    environment.err = open_memstream(&errText, &errSize);
    environment.currentDirectory = "/work/dir";
    environment.notifications = std::move(center);
    ToolRun result;
    result.status = qvctl::runQvctl(args, environment);
    std::fclose(environment.out);
    std::fclose(environment.err);
    result.out.assign(outText, outSize);
    result.err.assign(errText, errSize);
    std::free(outText);
    std::free(errText);
    return result;
  }

  // The qvctl binary itself, with the test's platform root.
  ToolRun runBinary(const std::string& arguments) {
    const std::string out = root_.path() + "/out";
    const std::string err = root_.path() + "/err";
    const std::string command =
        std::string(QVCTL_PATH) + " " + arguments + " >" + out + " 2>" + err;
    ToolRun result;
    int raw = std::system(command.c_str());
    result.status = WIFEXITED(raw) ? WEXITSTATUS(raw) : -1;
    auto slurp = [](const std::string& path) {
      std::ifstream file(path);
      std::stringstream text;
      text << file.rdbuf();
      return text.str();
    };
    result.out = slurp(out);
    result.err = slurp(err);
    return result;
  }

  platform::mbx::testing::TemporaryRoot root_;
  qvdtest::FakeDaemon daemon_{"qvd.cli"};
};

TEST_F(QvctlEndToEnd, ErrorRepliesAndUnreachableDaemonsExitWithStatus1) {
  struct Case {
    const char* name;
    Dictionary reply;
    std::vector<std::string_view> args;
    std::string err;
  };
  const Case cases[] = {
      {"error reply",
       {{"errorcode", 9}, {"error", "no plug-in at /x"}},
       {"--service", "qvd.cli", "remove", "/x"},
       "qvctl: error 9: no plug-in at /x\n"},
      {"protocol broken",
       {{"error", "half"}},
       {"--service", "qvd.cli", "bulk"},
       "qvctl: qvd reported error without a code: half\n"},
      {"hold without token",
       {},
       {"--service", "qvd.cli", "hold", "/x"},
       "qvctl: the daemon's reply carries no hold token\n"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    daemon_.answerWith(c.reply);
    ToolRun result = run(c.args);
    EXPECT_EQ(result.status, 1);
    EXPECT_EQ(result.err, c.err);
    EXPECT_EQ(result.out, "");
  }
  ToolRun absent = run({"--service", "qvd.nobody", "add", "x"});
  EXPECT_EQ(absent.status, 1);
  EXPECT_EQ(absent.err.rfind("qvctl: error 4: service unavailable", 0), 0u) << absent.err;
}

TEST_F(QvctlEndToEnd, WatchPrintsALinePerChangeAndStopsAtItsCount) {
  auto center = std::make_shared<platform::notify::FakeNotificationCenter>();
  ToolRun result;
  std::thread watcher([&] { result = run({"watch", "--count", "2"}, center); });
  ASSERT_TRUE(
      eventually([&] { return center->observerCountForTesting(QVNotifyAnnotationChange) == 1; }));
  ASSERT_TRUE(center->post(QVNotifyAnnotationChange).ok());
  ASSERT_TRUE(center->post("com.corvane.quorvex.unrelated").ok());
  ASSERT_TRUE(center->post(QVNotifyAnnotationChange).ok());
  watcher.join();
  EXPECT_EQ(result.status, 0);
  EXPECT_EQ(result.out,
            "com.corvane.quorvex.annotation-change 1\n"
            "com.corvane.quorvex.annotation-change 2\n");
  EXPECT_EQ(center->observerCountForTesting(QVNotifyAnnotationChange), 0u);
}

TEST_F(QvctlEndToEnd, TheBinaryReportsErrorRepliesAndUsageErrors) {
  daemon_.answerWith(Dictionary{{"errorcode", 9}, {"error", "no plug-in at /x/A.ovx"}});
  ToolRun error = runBinary("--service qvd.cli find /x/A.ovx");
  EXPECT_EQ(error.status, 1);
  EXPECT_EQ(error.err, "qvctl: error 9: no plug-in at /x/A.ovx\n");
  EXPECT_EQ(daemon_.request(1).get("paths"), Value("file:///x/A.ovx"));

  ToolRun usage = runBinary("annotate E621E1F8-C36C-495A-93FC-0C247A3E6E5F --election maybe");
  EXPECT_EQ(usage.status, 2);
  EXPECT_EQ(usage.err,
            "qvctl: --election: expected 0 or 1\n"
            "usage: qvctl annotate UUID... (--election 0|1 | --annotations JSON)\n"
            "Run 'qvctl help annotate' for more.\n");
}

}  // namespace
