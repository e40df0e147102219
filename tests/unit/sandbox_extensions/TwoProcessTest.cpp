// Tokens cross a process boundary: issued here, consumed by a freshly
// spawned helper that shares only the platform root (and so the key).
#include <gtest/gtest.h>
#include <fcntl.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <string>
#include <string_view>
#include <vector>

#include "SandboxTestSupport.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"

extern char** environ;

namespace platform::sandbox {
namespace {

namespace fs = std::filesystem;

// Runs the helper with `tokens` under `root`; answers its output lines, or
// none when it could not be run or did not exit with 0.
std::vector<std::string> runHelper(const std::string& root, const std::vector<std::string>& tokens) {
  std::vector<std::string> environment{"QV_ROOT=" + root};
  for (char** entry = environ; *entry != nullptr; ++entry) {
    if (std::string_view(*entry).substr(0, 8) != "QV_ROOT=") environment.emplace_back(*entry);
  }
  std::vector<std::string> arguments{SANDBOX_HELPER_PATH};
  arguments.insert(arguments.end(), tokens.begin(), tokens.end());
  std::vector<char*> argv, envp;
  for (std::string& a : arguments) argv.push_back(a.data());
  for (std::string& e : environment) envp.push_back(e.data());
  argv.push_back(nullptr);
  envp.push_back(nullptr);

  int out[2];
  if (::pipe2(out, O_CLOEXEC) != 0) return {};
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, out[1], 1);
  pid_t pid = -1;
  const int spawned =
      ::posix_spawn(&pid, SANDBOX_HELPER_PATH, &actions, nullptr, argv.data(), envp.data());
  posix_spawn_file_actions_destroy(&actions);
  ::close(out[1]);
  std::string output;
  char buffer[512];
  ssize_t n;
  while (spawned == 0 && ((n = ::read(out[0], buffer, sizeof buffer)) > 0 || (n < 0 && errno == EINTR))) {
    if (n > 0) output.append(buffer, static_cast<std::size_t>(n));
  }
  ::close(out[0]);
  if (spawned != 0) return {};
  int status = 0;
  while (::waitpid(pid, &status, 0) < 0 && errno == EINTR) {
  }
  if (!WIFEXITED(status) || WEXITSTATUS(status) != 0) return {};
  std::vector<std::string> lines;
  for (std::size_t start = 0, end; (end = output.find('\n', start)) != std::string::npos;
       start = end + 1) {
    lines.push_back(output.substr(start, end - start));
  }
  return lines;
}

TEST(SandboxExtensionsTwoProcesses, TokensIssuedHereAreConsumedThere) {
  sandbox_testing::TemporaryRoot root;
  fs::create_directories(root.path() + "/Bundle.plugin/Resources");
  const std::string resources = fs::canonical(root.path() + "/Bundle.plugin/Resources").string();
  LinuxSandboxExtensions issuer;
  Result<std::string> file = issuer.issueFileExtension(root.path() + "/Bundle.plugin/./Resources",
                                                       PathResolution::Canonicalise);
  Result<std::string> service =
      issuer.issueServiceExtension("com.corvane.quorvex.plugin-service", "com.example.svc");
  ASSERT_TRUE(file.ok() && service.ok());
  std::string altered = *file;
  altered[altered.size() - 70] ^= 0x01;  // in the path, just before the signature

  const std::vector<std::string> lines =
      runHelper(root.path(), {*file, altered, *service, "not a token"});
  const std::vector<std::string> expected{
      "consume 1 file " + resources,  // a fresh process counts from 1
      "consume errno " + std::to_string(EPERM),
      "consume 2 service com.example.svc",
      "consume errno " + std::to_string(EINVAL),
      "release 1 ok",
      "release 2 ok",
      "release 1 errno " + std::to_string(EBADF),
  };
  EXPECT_EQ(lines, expected);
}

TEST(SandboxExtensionsTwoProcesses, AnotherRootsKeyDoesNotVerify) {
  sandbox_testing::TemporaryRoot issuingRoot;
  LinuxSandboxExtensions issuer;
  Result<std::string> token = issuer.issueServiceExtension("c", "svc");
  ASSERT_TRUE(token.ok());
  sandbox_testing::TemporaryRoot consumingRoot;
  EXPECT_EQ(runHelper(consumingRoot.path(), {*token}),
            std::vector<std::string>{"consume errno " + std::to_string(EPERM)});
}

}  // namespace
}  // namespace platform::sandbox
