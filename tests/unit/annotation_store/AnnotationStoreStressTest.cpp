// The store under pressure: readers on other threads while changes run, and
// a writer killed at random moments, after which the file must still load.
#include <gtest/gtest.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <random>
#include <string>
#include <thread>
#include <vector>

#include "platform/container/testing/FakeContainerManager.h"
#include "qvd/QVDAnnotationStore.h"
#include "tests/unit/annotation_store/AnnotationStoreTestSupport.h"

extern char** environ;

namespace qvd::testing {
namespace {

using platform::Dictionary;
using platform::Value;

TEST(AnnotationStoreStressTest, ReadersSeeWholeAnnotationsWhileChangesRun) {
  ScratchDirectory dir;
  auto made = QVDAnnotationStore::initWithDatabase(
      dir.path() + "/Quorvex-Annotations",
      std::make_shared<platform::container::FakeContainerManager>());
  ASSERT_TRUE(made.ok());
  QVDAnnotationStore& store = **made;
  const FakePlugIn plugIn("shared");

  // Each change sets "election" and "extension" to the same number; a reader
  // that ever sees them differ, or sees the number go back, saw a torn change.
  std::atomic<bool> done{false};
  std::atomic<int> torn{0}, backwards{0};
  std::vector<std::thread> readers;
  for (int r = 0; r < 3; ++r) {
    readers.emplace_back([&] {
      std::int64_t last = -1;
      while (!done.load()) {
        std::optional<Dictionary> seen = store.annotationForIdentifier("shared");
        if (!seen) continue;
        const std::int64_t election = seen->get("election").int64().value_or(-2);
        const Dictionary* extension = seen->get("extension").dictionary();
        const std::int64_t n = extension ? extension->get("n").int64().value_or(-3) : -4;
        if (election != n) torn.fetch_add(1);
        if (n < last) backwards.fetch_add(1);
        last = n;
      }
    });
  }
  for (int n = 0; n < 150; ++n)
    store.setAnnotationForPlugIn(
        Dictionary{{"election", Value(n)}, {"extension", Value(Dictionary{{"n", Value(n)}})}},
        plugIn);
  done.store(true);
  for (std::thread& t : readers) t.join();

  EXPECT_EQ(torn.load(), 0);
  EXPECT_EQ(backwards.load(), 0);
  EXPECT_EQ(store.annotationForPlugIn(plugIn)->get("election"), Value(149));
}

// Starts the saver on `file`; returns its pid and the read end of its stdout.
pid_t startSaver(const std::string& file, int& output) {
  int fds[2];
  if (::pipe(fds) != 0) return -1;
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, fds[1], STDOUT_FILENO);
  posix_spawn_file_actions_addclose(&actions, fds[0]);
  std::string program = ANNOTATION_SAVER_PATH, argument = file;
  char* argv[] = {program.data(), argument.data(), nullptr};
  pid_t pid = -1;
  if (posix_spawn(&pid, program.c_str(), &actions, nullptr, argv, environ) != 0) pid = -1;
  posix_spawn_file_actions_destroy(&actions);
  ::close(fds[1]);
  output = fds[0];
  return pid;
}

TEST(AnnotationStoreStressTest, KilledWriterNeverLeavesAHalfWrittenFile) {
  ScratchDirectory dir;
  const std::string file = dir.path() + "/Quorvex-Annotations";
  std::mt19937 random{std::random_device{}()};
  std::uniform_int_distribution<int> delayMicros(0, 30000);
  std::size_t previous = 0;
  for (int kill = 0; kill < 30; ++kill) {
    SCOPED_TRACE("kill " + std::to_string(kill));
    int output = -1;
    const pid_t pid = startSaver(file, output);
    ASSERT_GT(pid, 0);
    char line[8] = {};
    const ssize_t got = ::read(output, line, sizeof line - 1);
    ::close(output);
    if (got > 0) std::this_thread::sleep_for(std::chrono::microseconds(delayMicros(random)));
    ::kill(pid, SIGKILL);
    int status = 0;
    ASSERT_EQ(::waitpid(pid, &status, 0), pid);
    ASSERT_GT(got, 0) << "the saver ended before its first save";
    ASSERT_TRUE(WIFSIGNALED(status) && WTERMSIG(status) == SIGKILL) << "status " << status;

    // Whole, and a table that only ever grew by complete annotations.
    const Dictionary root = rootOf(file);
    const Dictionary* data = root.get("data").dictionary();
    ASSERT_NE(data, nullptr);
    ASSERT_GT(data->size(), previous);
    for (std::size_t n = 0; n < data->size(); ++n) {
      const Dictionary* annotation = data->get("p" + std::to_string(n)).dictionary();
      ASSERT_NE(annotation, nullptr) << "p" << n;
      ASSERT_EQ(annotation->get("extension").dictionary()->get("n"), Value(n));
    }
    previous = data->size();
  }
}

}  // namespace
}  // namespace qvd::testing
