#include "tests/integration/DaemonHarness.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <sstream>
#include <thread>

#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace qvd::integration {

namespace {

std::string readWhole(const std::string& path) {
  std::stringstream text;
  text << std::ifstream(path, std::ios::binary).rdbuf();
  return text.str();
}

std::vector<char*> pointers(std::vector<std::string>& strings) {
  std::vector<char*> result;
  for (std::string& s : strings) result.push_back(s.data());
  result.push_back(nullptr);
  return result;
}

// Starts `argv` with its stdout and stderr sent to files.
pid_t spawn(std::vector<std::string> argv, std::vector<std::string> env, const std::string& outPath,
            const std::string& errPath) {
  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_addopen(&actions, 0, "/dev/null", O_RDONLY, 0);
  posix_spawn_file_actions_addopen(&actions, 1, outPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                   0600);
  posix_spawn_file_actions_addopen(&actions, 2, errPath.c_str(), O_WRONLY | O_CREAT | O_TRUNC,
                                   0600);
  // The child starts with no signal blocked, whatever this process blocks.
  posix_spawnattr_t attributes;
  posix_spawnattr_init(&attributes);
  sigset_t none;
  sigemptyset(&none);
  posix_spawnattr_setsigmask(&attributes, &none);
  posix_spawnattr_setflags(&attributes, POSIX_SPAWN_SETSIGMASK);
  pid_t pid = -1;
  auto args = pointers(argv);
  auto envp = pointers(env);
  if (posix_spawn(&pid, args[0], &actions, &attributes, args.data(), envp.data()) != 0) pid = -1;
  posix_spawn_file_actions_destroy(&actions);
  posix_spawnattr_destroy(&attributes);
  return pid;
}

int waitFor(pid_t pid, std::chrono::milliseconds limit) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  int status = 0;
  for (;;) {
    pid_t done = ::waitpid(pid, &status, WNOHANG);
    if (done == pid) break;
    if (done < 0) return -1;
    if (std::chrono::steady_clock::now() > deadline) {
      ::kill(pid, SIGKILL);
      ::waitpid(pid, &status, 0);
      return -2;
    }
    std::this_thread::sleep_for(2ms);
  }
  if (WIFEXITED(status)) return WEXITSTATUS(status);
  if (WIFSIGNALED(status)) return 128 + WTERMSIG(status);
  return -1;
}

std::atomic<int> gSerial{0};

}  // namespace

TemporaryRoot::TemporaryRoot() : path_("/tmp/qvd-it-XXXXXX") {
  if (::mkdtemp(path_.data()) == nullptr) std::abort();
}

TemporaryRoot::~TemporaryRoot() {
  std::error_code ignored;
  std::filesystem::remove_all(path_, ignored);
}

Finished runProcess(const std::vector<std::string>& argv, const std::string& root,
                    std::chrono::seconds limit) {
  const std::string stem = root + "/.run-" + std::to_string(++gSerial);
  Finished finished;
  pid_t pid = spawn(argv, {"QV_ROOT=" + root, "PATH=/usr/bin:/bin"}, stem + ".out", stem + ".err");
  if (pid < 0) return finished;
  finished.status = waitFor(pid, limit);
  finished.out = readWhole(stem + ".out");
  finished.err = readWhole(stem + ".err");
  return finished;
}

Daemon::Daemon(const TemporaryRoot& root, std::vector<std::string> arguments,
               std::string serviceName, DaemonLogging logging)
    : root_(root), serviceName_(std::move(serviceName)), logPath_(root / "qvd.log") {
  arguments.insert(arguments.begin(), QVD_PATH);
  const std::string level = logging == DaemonLogging::Debug ? "QV_LOG=debug" : "QV_LOG=info";
  pid_ =
      spawn(arguments, {"QV_ROOT=" + root.path(), "PATH=/usr/bin:/bin", level, "QV_LOG_PRIVATE=1"},
            root / "qvd.out", logPath_);
}

Daemon::~Daemon() {
  if (pid_ > 0) {
    ::kill(pid_, SIGKILL);
    ::waitpid(pid_, nullptr, 0);
  }
}

bool Daemon::waitUntilServing() {
  const std::string socketPath = root_ / ("run/quorvex/mbx/" + serviceName_);
  const auto deadline = std::chrono::steady_clock::now() + 10s;
  while (std::chrono::steady_clock::now() < deadline) {
    if (::waitpid(pid_, nullptr, WNOHANG) == pid_) {
      pid_ = -1;
      return false;
    }
    int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    sockaddr_un address{};
    address.sun_family = AF_UNIX;
    std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
    const bool connected =
        ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
    ::close(fd);
    // The listener accepts before main() logs its start line; a test that reads the log
    // right away must see that line, so serving means both.
    if (connected && countLines("with a plug-in cache limit of") > 0) return true;
    std::this_thread::sleep_for(5ms);
  }
  return false;
}

int Daemon::terminate() {
  if (pid_ <= 0) return -1;
  ::kill(pid_, SIGTERM);
  const int status = waitFor(pid_, 10s);
  pid_ = -1;
  return status;
}

void Daemon::kill() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGKILL);
  ::waitpid(pid_, nullptr, 0);
  pid_ = -1;
}

std::string Daemon::log() const {
  return readWhole(logPath_);
}

int Daemon::countLines(const std::string& text) const {
  std::istringstream lines(log());
  std::string line;
  int count = 0;
  while (std::getline(lines, line)) count += line.find(text) != std::string::npos;
  return count;
}

ClientRun sendRequest(const TemporaryRoot& root, const platform::Value& request,
                      std::vector<std::string> options) {
  ClientRun run;
  const std::string file = root / (".request-" + std::to_string(++gSerial) + ".vmap");
  auto text = platform::vmap::write(request, platform::vmap::Format::Xml);
  if (!text.ok()) return run;
  std::ofstream(file) << *text;
  std::vector<std::string> argv{REQUEST_CLIENT_PATH};
  argv.insert(argv.end(), options.begin(), options.end());
  argv.push_back(file);
  run.finished = runProcess(argv, root.path());
  if (run.finished.status == 0) {
    auto parsed = platform::vmap::read(std::span<const std::uint8_t>(
        reinterpret_cast<const std::uint8_t*>(run.finished.out.data()), run.finished.out.size()));
    if (parsed.ok()) run.reply = *parsed;
  }
  return run;
}

}  // namespace qvd::integration
