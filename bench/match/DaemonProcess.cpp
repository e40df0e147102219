#include "bench/match/DaemonProcess.h"

#include <fcntl.h>
#include <signal.h>
#include <spawn.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <cstdio>
#include <cstring>
#include <thread>
#include <vector>

#include "platform/values/Error.h"

extern char** environ;

namespace bench::match {

namespace {

bool accepts(const std::string& socketPath) {
  const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, socketPath.c_str(), sizeof address.sun_path - 1);
  const bool connected = ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) == 0;
  ::close(fd);
  return connected;
}

}  // namespace

platform::Result<DaemonProcess> DaemonProcess::start(const std::string& qvd,
                                                     const std::string& root) {
  std::vector<std::string> env{"QV_ROOT=" + root, "QV_LOG=error"};
  for (char** e = environ; *e != nullptr; ++e) {
    if (std::strncmp(*e, "QV_", 3) != 0) env.emplace_back(*e);
  }
  std::vector<char*> envp;
  for (std::string& e : env) envp.push_back(e.data());
  envp.push_back(nullptr);
  std::string program = qvd;
  char* argv[] = {program.data(), nullptr};

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  const std::string logPath = root + "/qvd.log";
  posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, logPath.c_str(),
                                   O_WRONLY | O_CREAT | O_TRUNC, 0644);
  pid_t pid = -1;
  const int spawned = ::posix_spawn(&pid, qvd.c_str(), &actions, nullptr, argv, envp.data());
  posix_spawn_file_actions_destroy(&actions);
  if (spawned != 0) return platform::Error::posix(spawned, "posix_spawn " + qvd);
  DaemonProcess process(pid);

  const std::string socketPath = root + "/run/quorvex/mbx/com.corvane.quorvex.qvd";
  const auto deadline = std::chrono::steady_clock::now() + std::chrono::minutes(1);
  while (std::chrono::steady_clock::now() < deadline) {
    if (::waitpid(pid, nullptr, WNOHANG) == pid) {
      process.pid_ = -1;
      return platform::Error::posix(ECHILD, "qvd exited at start; see " + logPath);
    }
    if (accepts(socketPath)) return process;
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  return platform::Error::posix(ETIMEDOUT, "qvd did not start; see " + logPath);
}

DaemonProcess::~DaemonProcess() {
  if (pid_ <= 0) return;
  ::kill(pid_, SIGTERM);
  ::waitpid(pid_, nullptr, 0);
}

long DaemonProcess::residentBytesOf(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/status";
  std::FILE* status = std::fopen(path.c_str(), "r");
  if (status == nullptr) return -1;
  char line[256];
  long kib = -1;
  while (std::fgets(line, sizeof line, status) != nullptr) {
    if (std::sscanf(line, "VmRSS: %ld kB", &kib) == 1) break;
  }
  std::fclose(status);
  return kib < 0 ? -1 : kib * 1024;
}

}  // namespace bench::match
