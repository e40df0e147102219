// A real plug-in process for the tests: the holds_plugin_process program
// copied into a plug-in bundle (so that /proc/<pid>/exe lies inside it),
// started with pipes for its commands, and told to take or free its busy
// assertion. Shared by the unit tests here and the integration tests. Use
// from one thread.
#pragma once

#include <fcntl.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <thread>
#include <vector>

extern char** environ;

namespace qvd::holds_testing {

inline constexpr const char* kPlugInProcessProgram = PLUGIN_PROCESS_PATH;

// Copies the program to <bundle>/<name> (a copy, not a link: /proc names
// a link's target). Returns the executable's path.
inline std::string installPlugInExecutable(const std::string& bundle,
                                           const std::string& name = "Plug") {
  std::filesystem::create_directories(bundle);
  const std::string executable = bundle + "/" + name;
  std::filesystem::copy_file(kPlugInProcessProgram, executable,
                             std::filesystem::copy_options::overwrite_existing);
  std::filesystem::permissions(executable, std::filesystem::perms::owner_all);
  return executable;
}

class PlugInProcess {
 public:
  // What the process does on SIGTERM: die at once, ignore it, or die
  // 300 ms later (as a plug-in saving its state would).
  enum class OnTerm { Die, Ignore, Linger };

  // Starts `executable`, with its busy assertion in the directory
  // `assertions` when given, and waits for it to be ready; null (with a
  // test failure) when it does not answer.
  static std::unique_ptr<PlugInProcess> start(const std::string& executable,
                                              std::optional<std::string> assertions = {},
                                              OnTerm onTerm = OnTerm::Die) {
    // A process that died must fail a command, not end the test by SIGPIPE.
    ::signal(SIGPIPE, SIG_IGN);
    std::unique_ptr<PlugInProcess> process(new PlugInProcess());
    int in[2], out[2];
    if (::pipe2(in, O_CLOEXEC) != 0 || ::pipe2(out, O_CLOEXEC) != 0) return nullptr;
    std::vector<std::string> args{executable};
    if (onTerm == OnTerm::Ignore) args.push_back("--ignore-term");
    if (onTerm == OnTerm::Linger) args.push_back("--linger-on-term");
    if (assertions) args.insert(args.end(), {"--assertions", *assertions});
    std::vector<char*> argv;
    for (std::string& arg : args) argv.push_back(arg.data());
    argv.push_back(nullptr);
    posix_spawn_file_actions_t actions;
    posix_spawn_file_actions_init(&actions);
    posix_spawn_file_actions_adddup2(&actions, in[0], STDIN_FILENO);
    posix_spawn_file_actions_adddup2(&actions, out[1], STDOUT_FILENO);
    // The child starts with no signal blocked and SIGTERM at its default,
    // whatever the test process has set.
    posix_spawnattr_t attributes;
    posix_spawnattr_init(&attributes);
    sigset_t none, term;
    sigemptyset(&none);
    sigemptyset(&term);
    sigaddset(&term, SIGTERM);
    posix_spawnattr_setsigmask(&attributes, &none);
    posix_spawnattr_setsigdefault(&attributes, &term);
    posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK | POSIX_SPAWN_SETSIGDEF);
    const int spawned = ::posix_spawn(&process->pid_, executable.c_str(), &actions, &attributes,
                                      argv.data(), environ);
    posix_spawn_file_actions_destroy(&actions);
    posix_spawnattr_destroy(&attributes);
    ::close(in[0]);
    ::close(out[1]);
    process->commands_ = in[1];
    process->answers_ = out[0];
    if (spawned != 0) {
      process->pid_ = -1;
      ADD_FAILURE() << "cannot start " << executable;
      return nullptr;
    }
    if (process->readAnswer() != 'R') {
      ADD_FAILURE() << executable << " did not become ready";
      return nullptr;
    }
    return process;
  }

  ~PlugInProcess() {
    if (commands_ >= 0) ::close(commands_);
    if (answers_ >= 0) ::close(answers_);
    if (pid_ > 0 && !status_) {
      ::kill(pid_, SIGKILL);
      ::waitpid(pid_, nullptr, 0);
    }
  }

  pid_t pid() const { return pid_; }
  // Takes (b) or frees (f) the busy assertion; true once it has.
  bool becomeBusy() { return command('b'); }
  bool becomeIdle() { return command('f'); }

  // Whether the process has ended, reaping it; waits up to `limit`.
  bool exited(std::chrono::milliseconds limit = std::chrono::milliseconds(0)) {
    const auto deadline = std::chrono::steady_clock::now() + limit;
    while (!status_) {
      int status = 0;
      if (::waitpid(pid_, &status, WNOHANG) == pid_) {
        status_ = status;
        break;
      }
      if (std::chrono::steady_clock::now() >= deadline) return false;
      std::this_thread::sleep_for(std::chrono::milliseconds(2));
    }
    return true;
  }
  // The signal that ended the process, 0 when it exited by itself or runs.
  int terminatingSignal() const {
    return status_ && WIFSIGNALED(*status_) ? WTERMSIG(*status_) : 0;
  }

 private:
  PlugInProcess() = default;

  char readAnswer() {
    struct pollfd entry = {answers_, POLLIN, 0};
    char byte = 0;
    if (::poll(&entry, 1, 10'000) != 1 || ::read(answers_, &byte, 1) != 1) return 0;
    return byte;
  }
  bool command(char byte) { return ::write(commands_, &byte, 1) == 1 && readAnswer() == byte; }

  pid_t pid_ = -1;
  int commands_ = -1;
  int answers_ = -1;
  std::optional<int> status_;
};

}  // namespace qvd::holds_testing
