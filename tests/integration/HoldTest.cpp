// Plug-in holds against the real daemon, with every client and every
// plug-in in a process of its own: a hold taken and released by token, holds
// ending with their holder's connection, the notification each change
// posts, "find" ignoring holds, the busy refusal, forced termination that
// ends the running plug-in before the reply, and qvctl's hold and release.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <optional>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"
#include "tests/unit/holds/PlugInProcess.h"

namespace qvd::integration {
namespace {

using holds_testing::PlugInProcess;
using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;

constexpr std::uint64_t kPlugInPaths = 0x1, kRefuseBusy = 0x2, kTerminate = 0x4;

Dictionary lockRequest(std::uint64_t flags, const std::vector<std::string>& paths) {
  Array list;
  for (const std::string& path : paths) list.append(Value(path));
  return Dictionary{{std::string(QVDRequestKey), std::string(QVDLockdownRequest)},
                    {std::string(QVDVersionKey), 3},
                    {std::string(QVDFlagsKey), flags},
                    {std::string(QVDPathsKey), std::move(list)}};
}

Uuid tokenOf(const Value& reply) {
  const Dictionary* body = reply.dictionary();
  return body ? body->get(QVDUUIDKey).uuid().value_or(Uuid()) : Uuid();
}

// A client process that takes holds and keeps its connection until told to
// go (or killed): qvd_hold_client.
class Holder {
 public:
  Holder(const TemporaryRoot& root, const Dictionary& request, int count = 1)
      : replyPath_(root / (".holder-" + Uuid::generate().toString() + ".vmap")) {
    const std::string requestPath = replyPath_ + ".request";
    writeVmapFile(requestPath, Value(request));
    int in[2];
    if (::pipe2(in, O_CLOEXEC) != 0) return;
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in[0], STDIN_FILENO);
    std::vector<std::string> args{HOLD_CLIENT_PATH, "--count", std::to_string(count), requestPath,
                                  replyPath_};
    std::vector<std::string> env{"QV_ROOT=" + root.path(), "PATH=/usr/bin:/bin"};
    auto pointers = [](std::vector<std::string>& strings) {
      std::vector<char*> out;
      for (std::string& s : strings) out.push_back(s.data());
      out.push_back(nullptr);
      return out;
    };
    auto argv = pointers(args);
    auto envp = pointers(env);
    if (::posix_spawn(&pid_, HOLD_CLIENT_PATH, &actions, nullptr, argv.data(), envp.data()) != 0) {
      pid_ = -1;
    }
    posix_spawn_file_actions_destroy(&actions);
    ::close(in[0]);
    stdin_ = in[1];
  }
  ~Holder() {
    if (stdin_ >= 0) ::close(stdin_);
    if (pid_ > 0) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
  }
  pid_t pid() const { return pid_; }
  // The last reply, once it has come (none after 10 s).
  Value reply() const {
    if (!eventually([&] { return std::filesystem::exists(replyPath_); })) return Value();
    return readVmapFile(replyPath_);
  }
  // Ends the connection: by leaving, or by dying.
  void leave() { finish(false); }
  void die() { finish(true); }

 private:
  void finish(bool kill) {
    if (kill) ::kill(pid_, SIGKILL);
    ::close(stdin_);
    stdin_ = -1;
    ::waitpid(pid_, nullptr, 0);
    pid_ = -1;
  }

  std::string replyPath_;
  pid_t pid_ = -1;
  int stdin_ = -1;
};

class HoldTest : public ::testing::Test {
 protected:
  void SetUp() override {
    // Forced termination looks at every process of the system: these
    // plug-ins' identifiers are this test process's own.
    for (const char* name : {"alpha", "beta"}) {
      names_[name] = std::string(name) + std::to_string(::getpid());
      paths_[name] = writeSystemPlugIn(root_, names_[name]);
    }
    daemon_.emplace(root_, std::vector<std::string>{});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
  }
  void TearDown() override {
    if (daemon_) {
      EXPECT_EQ(daemon_->terminate(), 0) << daemon_->log();
    }
  }

  std::string identifier(const std::string& name) { return "com.example." + names_[name]; }
  std::uint64_t posts() { return postCount(root_, kChange); }
  Value send(const Dictionary& message) {
    ClientRun run = sendRequest(root_, Value(message));
    EXPECT_EQ(run.finished.status, 0) << run.finished.err;
    return run.reply;
  }
  Value release(const Uuid& token) {
    return send(Dictionary{{std::string(QVDRequestKey), std::string(QVDLockdownRequest)},
                           {std::string(QVDVersionKey), 3},
                           {std::string(QVDUUIDKey), Array{Value(token)}}});
  }
  // A running instance of the plug-in `name`: its executable lies in the
  // bundle, its busy assertion where the platform looks for it.
  std::unique_ptr<PlugInProcess> run(const std::string& name,
                                     PlugInProcess::OnTerm onTerm = PlugInProcess::OnTerm::Die) {
    return PlugInProcess::start(holds_testing::installPlugInExecutable(paths_[name]),
                                root_ / ("run/quorvex/assertions/" + identifier(name)), onTerm);
  }
  int logLines(const std::string& text) { return daemon_->countLines(text); }

  TemporaryRoot root_;
  std::map<std::string, std::string> names_;
  std::map<std::string, std::string> paths_;
  std::optional<Daemon> daemon_;
};

TEST_F(HoldTest, AHoldIsTakenAndReleasedByTokenWithANotificationEach) {
  const std::uint64_t before = posts();
  Holder holder(root_, lockRequest(kPlugInPaths, {paths_["alpha"]}));
  const Value granted = holder.reply();
  EXPECT_EQ(errorOf(granted), kSuccess) << daemon_->log();
  const Uuid token = tokenOf(granted);
  ASSERT_FALSE(token.isNull()) << Value(granted).description();
  EXPECT_EQ(posts(), before + 1);
  EXPECT_EQ(logLines("hold request granted uuid:" + token.toString()), 1);

  // Anyone holding the token releases the hold.
  EXPECT_EQ(errorOf(release(token)), kSuccess);
  EXPECT_EQ(posts(), before + 2);
  EXPECT_EQ(logLines("releasing plug-in hold " + token.toString() + " at client's request"), 1);

  // Its holder leaving later finds nothing left to release.
  const int deaths = logLines("is dead");
  holder.leave();
  ASSERT_TRUE(eventually([&] { return logLines("is dead") > deaths; }));
  EXPECT_EQ(posts(), before + 2);
  EXPECT_EQ(logLines("for dead client pid"), 0);
}

TEST_F(HoldTest, HoldsEndWithTheirHoldersConnectionAndFindIgnoresThem) {
  const std::uint64_t before = posts();
  Holder holder(root_, lockRequest(kPlugInPaths, {paths_["alpha"], paths_["beta"]}), 3);
  ASSERT_FALSE(tokenOf(holder.reply()).isNull()) << daemon_->log();
  EXPECT_EQ(posts(), before + 3);

  // "find" answers a held plug-in all the same.
  const Value found = send(Dictionary{{std::string(QVDRequestKey), std::string(QVDFindRequest)},
                                      {std::string(QVDVersionKey), 3},
                                      {std::string(QVDPathsKey), "file://" + paths_["alpha"]}});
  const Dictionary* form =
      found.dictionary() ? found.dictionary()->get(QVDMatchesKey).dictionary() : nullptr;
  ASSERT_NE(form, nullptr) << found.description();
  EXPECT_EQ(form->get(QVFormIdentifierKey), Value(identifier("alpha")));

  const pid_t pid = holder.pid();
  holder.die();
  ASSERT_TRUE(eventually([&] { return posts() == before + 6; })) << posts() - before;
  EXPECT_EQ(logLines("for dead client pid " + std::to_string(pid)), 3);
  std::this_thread::sleep_for(50ms);
  EXPECT_EQ(posts(), before + 6) << "one notification per released hold";
}

TEST_F(HoldTest, ABusyPlugInRefusesTheHoldWithItsConflictAndKeepsRunning) {
  auto plugIn = run("alpha");
  ASSERT_NE(plugIn, nullptr);
  ASSERT_TRUE(plugIn->becomeBusy());
  const std::uint64_t before = posts();
  const Value refused =
      send(lockRequest(kPlugInPaths | kRefuseBusy | kTerminate, {paths_["beta"], paths_["alpha"]}));
  EXPECT_EQ(errorOf(refused), (std::pair<std::uint64_t, std::string>{14, "plug-ins are busy"}));
  ASSERT_NE(refused.dictionary(), nullptr);
  EXPECT_EQ(refused.dictionary()->get(QVDConflictsKey),
            Value(Array{Value(Dictionary{{"BXBundleIdentifier", identifier("alpha")}})}));
  EXPECT_TRUE(tokenOf(refused).isNull());
  EXPECT_EQ(posts(), before) << "no hold was made";
  EXPECT_FALSE(plugIn->exited(50ms)) << "nothing is terminated for a refused hold";

  // Its lock freed, the file left behind is stale and the plug-in idle.
  ASSERT_TRUE(plugIn->becomeIdle());
  EXPECT_EQ(errorOf(send(lockRequest(kPlugInPaths | kRefuseBusy, {paths_["alpha"]}))), kSuccess);
  EXPECT_TRUE(eventually([&] { return posts() == before + 2; }))
      << "granted, and released with its client";
}

TEST_F(HoldTest, ForcedTerminationEndsTheRunningPlugInBeforeTheReply) {
  // It takes 300 ms to end after SIGTERM: a reply that did not wait for
  // it would come first.
  auto alpha = run("alpha", PlugInProcess::OnTerm::Linger);
  auto beta = run("beta");
  ASSERT_TRUE(alpha && beta);
  const Value granted = send(lockRequest(kPlugInPaths | kTerminate, {paths_["alpha"]}));
  EXPECT_EQ(errorOf(granted), kSuccess) << daemon_->log();
  // The reply is in: the plug-in has ended already, by SIGTERM.
  EXPECT_TRUE(alpha->exited()) << daemon_->log();
  EXPECT_EQ(alpha->terminatingSignal(), SIGTERM);
  EXPECT_FALSE(beta->exited(20ms)) << "another plug-in is left alone";
  const Uuid token = tokenOf(granted);
  ASSERT_FALSE(token.isNull());
  EXPECT_EQ(logLines("forced termination complete; hold request granted uuid:" + token.toString()),
            1);
  EXPECT_EQ(logLines("one or more plug-ins have been terminated for uuid="), 1);

  // With nothing running the hold is granted all the same.
  EXPECT_EQ(errorOf(send(lockRequest(kPlugInPaths | kTerminate, {paths_["alpha"]}))), kSuccess);
  EXPECT_EQ(logLines("lumend reported no plug-ins on record for uuid="), 1);
}

TEST_F(HoldTest, QvctlHoldsAndReleases) {
  const std::uint64_t before = posts();
  Finished held = runQvctl(root_, {"hold", "--flags", "1", paths_["alpha"]});
  ASSERT_EQ(held.status, 0) << held.err;
  const std::optional<Uuid> token = Uuid::parse(held.out.substr(0, held.out.find('\n')));
  ASSERT_TRUE(token) << held.out;
  EXPECT_EQ(logLines("hold request granted uuid:" + token->toString()), 1);
  // qvctl's connection ended with it, and the hold with the connection.
  ASSERT_TRUE(eventually([&] { return posts() == before + 2; })) << posts() - before;

  Finished released = runQvctl(root_, {"release", token->toString()});
  EXPECT_EQ(released.status, 0) << released.err;
  EXPECT_EQ(posts(), before + 2);

  auto plugIn = run("beta");
  ASSERT_TRUE(plugIn && plugIn->becomeBusy());
  Finished refused = runQvctl(root_, {"hold", "--flags", "7", paths_["beta"]});
  EXPECT_EQ(refused.status, 1);
  EXPECT_NE(refused.err.find("qvctl: error 14: plug-ins are busy"), std::string::npos)
      << refused.err;
  Finished missing = runQvctl(root_, {"hold", "--flags", "1", root_ / "nothing.ovx"});
  EXPECT_EQ(missing.status, 1);
  EXPECT_NE(missing.err.find("error 9: invalid path: " + (root_ / "nothing.ovx")),
            std::string::npos)
      << missing.err;
}

// With --wait, qvctl keeps its hold until its standard input ends, then
// releases it itself.
TEST_F(HoldTest, QvctlWaitKeepsTheHoldUntilInputEnds) {
  const std::uint64_t before = posts();
  const std::string out = root_ / "hold-wait.out";
  const std::string command = "QV_ROOT='" + root_.path() +
                              "' QV_LOG=error '" QVCTL_PATH "' hold --wait --flags 1 '" +
                              paths_["alpha"] + "' > '" + out + "'";
  std::FILE* input = ::popen(command.c_str(), "w");
  ASSERT_NE(input, nullptr);
  ASSERT_TRUE(eventually([&] { return logLines("hold request granted uuid:") == 1; }))
      << daemon_->log();
  std::this_thread::sleep_for(200ms);
  EXPECT_EQ(posts(), before + 1) << "still held while qvctl waits";
  const int status = ::pclose(input);
  EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << status;
  EXPECT_EQ(logLines("at client's request"), 1) << daemon_->log();
  EXPECT_EQ(posts(), before + 2);
}

}  // namespace
}  // namespace qvd::integration
