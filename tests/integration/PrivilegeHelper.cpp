// Processes for the privilege tests, which need clients the request client
// cannot be:
//   qvd_privilege_helper confined PROGRAM [ARG...]
//     runs PROGRAM under NoNewPrivs and a seccomp filter, as a sandboxed host
//     would run;
//   qvd_privilege_helper remove SOCKET PATH
//     asks the daemon to remove PATH and prints "reply <errorcode>";
//   qvd_privilege_helper idle
//     waits to be killed (a process that only holds its pid);
//   qvd_privilege_helper orphan SOCKET PATH ENTITLED [DAEMON_PID]
//     a connection that outlives the process that made it, whose pid then
//     goes to ENTITLED (run as "ENTITLED idle"). Prints "first <errorcode>"
//     for a removal asked while the maker lived (not when DAEMON_PID is
//     given: then the daemon is stopped from before the connection until the
//     pid has passed on, so that it takes the identity only afterwards),
//     "reused <pid>", and the outcome of the removal the orphaned connection
//     then asks: "reply <errorcode>", "closed" or "no reply".
// Exit: 0 when the scenario ran, 2 for bad arguments, 3 when the daemon could
// not be reached, 4 when others kept taking the pid, 5 when this process can
// neither set the next pid nor cycle through all of them in good time.
#include <fcntl.h>
#include <linux/filter.h>
#include <linux/seccomp.h>
#include <signal.h>
#include <sys/prctl.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>

#include <cerrno>
#include <climits>
#include <cstdio>
#include <filesystem>
#include <fstream>
#include <iterator>
#include <optional>
#include <string>

#include "Quorvex/QVDConstants.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "tests/integration/RawSocketClient.h"

namespace {

using qvd::integration::RawSocketClient;
using namespace std::chrono_literals;

platform::Value removal(const std::string& path) {
  platform::Dictionary request{{std::string(QVDRequestKey), std::string(QVDRemoveRequest)},
                               {std::string(QVDVersionKey), 3}};
  request.set(QVDPathsKey, platform::Array{platform::Value(path)});
  return request;
}

// What the daemon made of a removal on `client`, as one word and a code.
std::string outcomeOf(RawSocketClient& client, const std::string& path) {
  if (client.sendRequest(removal(path)) == 0) return "closed";
  const RawSocketClient::Received received = client.receive(10s);
  if (received.outcome == RawSocketClient::Outcome::Closed) return "closed";
  if (received.outcome != RawSocketClient::Outcome::Frame) return "no reply";
  const platform::Dictionary* reply = received.body.dictionary();
  const platform::Value code = reply != nullptr ? reply->get(QVDErrorCodeKey) : platform::Value();
  return "reply " + std::to_string(code.uint64().value_or(0));
}

int confined(char** argv) {
  // Allows every call: the filter's presence is what makes a sandbox.
  struct sock_filter allow = BPF_STMT(BPF_RET | BPF_K, SECCOMP_RET_ALLOW);
  struct sock_fprog program = {1, &allow};
  if (::prctl(PR_SET_NO_NEW_PRIVS, 1, 0, 0, 0) != 0 ||
      ::syscall(SYS_seccomp, SECCOMP_SET_MODE_FILTER, 0, &program) != 0) {
    std::perror("seccomp");
    return 2;
  }
  ::execv(argv[0], argv);
  std::perror("execv");
  return 2;
}

int pidMax() {
  std::ifstream file("/proc/sys/kernel/pid_max");
  int value = 0;
  return file >> value && value > 0 ? value : 32768;
}

// Whether every pid after `from` and before `to` is in use, so that the
// kernel's next pid after `from` is `to`.
bool allTakenBetween(pid_t from, pid_t to) {
  for (pid_t pid = from + 1; pid < to; ++pid) {
    if (::kill(pid, 0) != 0 && errno == ESRCH) return false;
  }
  return true;
}

// Whether `pid` runs `program` (not merely a copy of this one, about to
// exec it), waiting up to 5 s for the exec.
bool runs(pid_t pid, const char* program) {
  char wanted[PATH_MAX];
  if (::realpath(program, wanted) == nullptr) return false;
  const std::string link = "/proc/" + std::to_string(pid) + "/exe";
  for (int tries = 0; tries < 500; ++tries) {
    char seen[PATH_MAX] = {};
    const ssize_t n = ::readlink(link.c_str(), seen, sizeof seen - 1);
    if (n > 0 && std::string(seen, n) == wanted) return true;
    ::usleep(10'000);
  }
  return false;
}

// Starts `entitled` idle and answers its pid when that is `target`;
// otherwise ends it and answers 0.
pid_t startIfTarget(pid_t target, const char* entitled) {
  const pid_t child = ::fork();
  if (child == 0) {
    ::execl(entitled, entitled, "idle", static_cast<char*>(nullptr));
    ::_exit(127);
  }
  if (child == target && runs(child, entitled)) return child;
  ::kill(child, SIGKILL);
  ::waitpid(child, nullptr, 0);
  return 0;
}

// Runs `entitled` idle under `target`, once that pid is free. A process
// that may set the namespace's last pid does so; others fork short-lived
// children until the kernel's next pid is `target`, which takes too long
// where pids go up to millions. 0 when others kept taking the pid, -1 when
// neither way is open here.
pid_t startUnderPid(pid_t target, const char* entitled) {
  const int last = ::open("/proc/sys/kernel/ns_last_pid", O_WRONLY | O_CLOEXEC);
  if (last >= 0) {
    const std::string before = std::to_string(target - 1);
    pid_t started = 0;
    for (int tries = 0; started == 0 && tries < 100; ++tries) {
      if (::pwrite(last, before.data(), before.size(), 0) < 0) break;
      started = startIfTarget(target, entitled);
    }
    ::close(last);
    if (started != 0) return started;
  }
  const int max = pidMax();
  if (max > 131072) return -1;
  for (long forks = 0; forks < 4L * max; ++forks) {
    const pid_t spent = ::vfork();
    if (spent == 0) ::_exit(0);
    if (spent < 0) return 0;
    ::waitpid(spent, nullptr, 0);
    // The pids just below the target may be taken (this process's own, for
    // one), and after the highest pid the kernel starts again above 300.
    const bool next = spent < target ? target - spent <= 1000 && allTakenBetween(spent, target)
                                     : spent == max - 1 && target == 300;
    if (!next) continue;
    if (const pid_t started = startIfTarget(target, entitled)) return started;
  }
  return 0;
}

// Stops `pid` and waits up to 5 s until every one of its threads has
// stopped: SIGSTOP only asks, and a thread still running could accept a
// connection made right after the kill.
bool stopWholly(pid_t pid) {
  if (::kill(pid, SIGSTOP) != 0) return false;
  const std::string tasks = "/proc/" + std::to_string(pid) + "/task";
  for (int tries = 0; tries < 500; ++tries) {
    bool allStopped = true;
    std::error_code error;
    for (const auto& task : std::filesystem::directory_iterator(tasks, error)) {
      std::ifstream stat(task.path() / "stat");
      std::string text((std::istreambuf_iterator<char>(stat)), std::istreambuf_iterator<char>());
      // The state follows the command name, which is in parentheses.
      const std::size_t close = text.rfind(')');
      if (close == std::string::npos || close + 2 >= text.size() || text[close + 2] != 'T') {
        allStopped = false;
        break;
      }
    }
    if (allStopped && !error) return true;
    ::usleep(10'000);
  }
  return false;
}

// A line from `fd`, without its newline; empty at end of file.
std::string lineFrom(int fd) {
  std::string line;
  char c;
  while (::read(fd, &c, 1) == 1 && c != '\n') line += c;
  return line;
}

int orphan(const std::string& socket, const std::string& path, const char* entitled, pid_t daemon) {
  int go[2], done[2];
  if (::pipe(go) != 0 || ::pipe(done) != 0) return 2;
  if (daemon > 0 && !stopWholly(daemon)) {
    ::kill(daemon, SIGCONT);
    return 3;
  }
  const pid_t maker = ::fork();
  if (maker == 0) {
    std::optional<RawSocketClient> client = RawSocketClient::connect(socket);
    if (!client) ::_exit(3);
    if (daemon <= 0) std::printf("first %s\n", outcomeOf(*client, path).c_str());
    std::fflush(stdout);
    if (::fork() == 0) {
      // The connection's heir: waits until the pid has passed on, then asks
      // and reports through `done`. It keeps no write end of `go`, so that
      // it sees the end of the file if the pid never passes on.
      ::close(go[1]);
      char byte;
      if (::read(go[0], &byte, 1) != 1) ::_exit(0);
      const std::string outcome = outcomeOf(*client, path) + "\n";
      if (::write(done[1], outcome.data(), outcome.size()) < 0) ::_exit(1);
      ::_exit(0);
    }
    ::_exit(0);
  }
  ::close(done[1]);
  int status = 0;
  ::waitpid(maker, &status, 0);
  const bool made = WIFEXITED(status) && WEXITSTATUS(status) == 0;
  const pid_t reused = made ? startUnderPid(maker, entitled) : 0;
  if (daemon > 0) ::kill(daemon, SIGCONT);
  if (!made) return 3;
  if (reused == 0) return 4;
  if (reused < 0) return 5;
  std::printf("reused %d\n", static_cast<int>(reused));
  // The entitled process keeps the pid until the heir has its answer.
  const bool told = ::write(go[1], "g", 1) == 1;
  ::close(go[1]);
  std::printf("%s\n", told ? lineFrom(done[0]).c_str() : "");
  ::kill(reused, SIGKILL);
  ::waitpid(reused, nullptr, 0);
  return 0;
}

}  // namespace

int main(int argc, char** argv) {
  const std::string mode = argc > 1 ? argv[1] : "";
  if (mode == "confined" && argc > 2) return confined(argv + 2);
  if (mode == "idle") {
    for (;;) ::pause();
  }
  if (mode == "remove" && argc == 4) {
    std::optional<RawSocketClient> client = RawSocketClient::connect(argv[2]);
    if (!client) return 3;
    std::printf("%s\n", outcomeOf(*client, argv[3]).c_str());
    return 0;
  }
  if (mode == "orphan" && (argc == 5 || argc == 6)) {
    return orphan(argv[2], argv[3], argv[4], argc == 6 ? std::stoi(argv[5]) : 0);
  }
  std::fprintf(stderr, "usage: see the head of PrivilegeHelper.cpp\n");
  return 2;
}
