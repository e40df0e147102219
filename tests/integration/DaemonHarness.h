// Runs the real qvd binary, and client processes, on a temporary platform
// root for the integration tests.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>
#include <vector>

#include "platform/values/Value.h"

namespace qvd::integration {

using namespace std::chrono_literals;

// Polls `done` until it holds or `limit` passes; answers whether it held.
inline bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit = 10s) {
  const auto deadline = std::chrono::steady_clock::now() + limit;
  while (!done()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(5ms);
  }
  return true;
}

// A finished process: its exit status (or 128 + signal) and what it wrote.
struct Finished {
  int status = -1;
  std::string out;
  std::string err;
};

class TemporaryRoot {
 public:
  TemporaryRoot();
  ~TemporaryRoot();
  const std::string& path() const { return path_; }
  std::string operator/(const std::string& relative) const { return path_ + "/" + relative; }

 private:
  std::string path_;
};

// Runs `argv` with QV_ROOT=root, waits for it (killed after `limit`) and
// collects its output.
Finished runProcess(const std::vector<std::string>& argv, const std::string& root,
                    std::chrono::seconds limit = 10s);

// How much a test daemon logs: every level (for tests that read its debug
// lines), or info and up, for runs whose debug lines would fill the disk.
enum class DaemonLogging { Debug, Info };

// A qvd process with its log (nothing redacted) in a file.
class Daemon {
 public:
  Daemon(const TemporaryRoot& root, std::vector<std::string> arguments,
         std::string serviceName = "com.corvane.quorvex.qvd",
         DaemonLogging logging = DaemonLogging::Debug);
  ~Daemon();
  // Waits until it accepts connections (false after 10 s or when it exited).
  bool waitUntilServing();
  // Sends SIGTERM and waits for the exit: its status, or -1.
  int terminate();
  // Ends it with SIGKILL, as a crash would, and reaps it.
  void kill();
  std::string log() const;
  pid_t pid() const { return pid_; }
  // How many lines of the log contain `text`.
  int countLines(const std::string& text) const;

 private:
  const TemporaryRoot& root_;
  std::string serviceName_;
  std::string logPath_;
  pid_t pid_ = -1;
};

// Writes `request` as a vmap file in the root and runs the request client
// on it: the reply, parsed, is in `reply` when the status is 0.
struct ClientRun {
  Finished finished;
  platform::Value reply;
};
ClientRun sendRequest(const TemporaryRoot& root, const platform::Value& request,
                      std::vector<std::string> options = {});

}  // namespace qvd::integration
