#include "bench/suite/Suite.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <spawn.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cmath>
#include <cstdio>
#include <cstdlib>
#include <cstring>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "bench/match/DaemonProcess.h"
#include "platform/dispatch/Semaphore.h"

extern char** environ;

namespace bench::suite {

using platform::Dictionary;
using platform::Value;

double percentile(std::vector<double> samples, double p) {
  if (samples.empty()) return 0;
  std::sort(samples.begin(), samples.end());
  return samples[static_cast<std::size_t>(p * static_cast<double>(samples.size() - 1) + 0.5)];
}

std::string duration(double seconds) {
  char text[32];
  if (seconds < 1e-3) {
    std::snprintf(text, sizeof text, "%.1f µs", seconds * 1e6);
  } else if (seconds < 1) {
    std::snprintf(text, sizeof text, "%.2f ms", seconds * 1e3);
  } else {
    std::snprintf(text, sizeof text, "%.2f s", seconds);
  }
  return text;
}

std::string grouped(double n) {
  std::string digits = std::to_string(static_cast<long long>(std::llround(n)));
  const std::size_t first = digits[0] == '-' ? 1 : 0;
  for (std::size_t at = digits.size(); at > first + 3; at -= 3) digits.insert(at - 3, ",");
  return digits;
}

// ---- Processes -------------------------------------------------------------

platform::Result<std::unique_ptr<Helper>> Helper::start(const std::vector<std::string>& argv,
                                                        const std::string& errorPath) {
  int out[2];
  if (::pipe2(out, O_CLOEXEC) != 0) return platform::Error::posix(errno, "pipe");
  std::vector<std::string> args(argv);
  std::vector<char*> argp;
  for (std::string& a : args) argp.push_back(a.data());
  argp.push_back(nullptr);

  posix_spawn_file_actions_t actions;
  posix_spawn_file_actions_init(&actions);
  posix_spawn_file_actions_adddup2(&actions, out[1], STDOUT_FILENO);
  if (!errorPath.empty()) {
    posix_spawn_file_actions_addopen(&actions, STDERR_FILENO, errorPath.c_str(),
                                     O_WRONLY | O_CREAT | O_APPEND, 0644);
  }
  pid_t pid = -1;
  const int spawned =
      ::posix_spawnp(&pid, args[0].c_str(), &actions, nullptr, argp.data(), environ);
  posix_spawn_file_actions_destroy(&actions);
  ::close(out[1]);
  if (spawned != 0) {
    ::close(out[0]);
    return platform::Error::posix(spawned, "posix_spawn " + args[0]);
  }
  return std::unique_ptr<Helper>(new Helper(pid, out[0]));
}

Helper::~Helper() {
  ::close(out_);
  ::kill(pid_, SIGTERM);
  ::waitpid(pid_, nullptr, 0);
}

std::optional<std::string> Helper::readLine(double timeoutSeconds) {
  const auto deadline = std::chrono::steady_clock::now() +
                        std::chrono::microseconds(static_cast<long>(timeoutSeconds * 1e6));
  for (;;) {
    if (const std::size_t end = pending_.find('\n'); end != std::string::npos) {
      std::string line = pending_.substr(0, end);
      pending_.erase(0, end + 1);
      return line;
    }
    const auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
        deadline - std::chrono::steady_clock::now());
    if (left.count() <= 0) return std::nullopt;
    pollfd p{out_, POLLIN, 0};
    if (::poll(&p, 1, static_cast<int>(left.count())) <= 0) continue;
    char buffer[512];
    const ssize_t n = ::read(out_, buffer, sizeof buffer);
    if (n <= 0) return std::nullopt;
    pending_.append(buffer, static_cast<std::size_t>(n));
  }
}

std::string selfPath() {
  char path[4096];
  const ssize_t n = ::readlink("/proc/self/exe", path, sizeof path - 1);
  if (n <= 0) return {};
  return std::string(path, static_cast<std::size_t>(n));
}

cpu_set_t allowedCpus() {
  cpu_set_t cpus;
  CPU_ZERO(&cpus);
  ::sched_getaffinity(0, sizeof cpus, &cpus);
  return cpus;
}

cpu_set_t firstCpu() {
  const cpu_set_t allowed = allowedCpus();
  cpu_set_t one;
  CPU_ZERO(&one);
  for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu) {
    if (CPU_ISSET(cpu, &allowed)) {
      CPU_SET(cpu, &one);
      break;
    }
  }
  return one;
}

void setProcessAffinity(pid_t pid, const cpu_set_t& cpus) {
  const std::string tasks =
      pid == 0 ? std::string("/proc/self/task") : "/proc/" + std::to_string(pid) + "/task";
  // Twice: a thread started while the first pass ran inherits whatever its
  // parent had then.
  for (int pass = 0; pass < 2; ++pass) {
    DIR* dir = ::opendir(tasks.c_str());
    if (dir == nullptr) return;
    while (dirent* entry = ::readdir(dir)) {
      if (entry->d_name[0] == '.') continue;
      ::sched_setaffinity(static_cast<pid_t>(std::atol(entry->d_name)), sizeof cpus, &cpus);
    }
    ::closedir(dir);
  }
}

long residentBytes(pid_t pid) {
  return bench::match::DaemonProcess::residentBytesOf(pid);
}

double cpuSeconds(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/stat";
  std::FILE* stat = std::fopen(path.c_str(), "r");
  if (stat == nullptr) return 0;
  char text[1024];
  const std::size_t n = std::fread(text, 1, sizeof text - 1, stat);
  std::fclose(stat);
  text[n] = '\0';
  // Fields after the command name, which may hold spaces: state is field 3,
  // utime and stime fields 14 and 15.
  const char* after = std::strrchr(text, ')');
  if (after == nullptr) return 0;
  unsigned long utime = 0;
  unsigned long stime = 0;
  if (std::sscanf(after + 2, "%*c %*d %*d %*d %*d %*d %*u %*u %*u %*u %*u %lu %lu", &utime,
                  &stime) != 2) {
    return 0;
  }
  return static_cast<double>(utime + stime) / static_cast<double>(::sysconf(_SC_CLK_TCK));
}

long openDescriptors(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid) + "/fd";
  DIR* dir = ::opendir(path.c_str());
  if (dir == nullptr) return -1;
  long count = 0;
  while (dirent* entry = ::readdir(dir)) {
    if (entry->d_name[0] != '.') ++count;
  }
  ::closedir(dir);
  return count;
}

// ---- Requests --------------------------------------------------------------

namespace {

bool failed(const platform::Result<Value>& reply, const char* what) {
  if (auto error = QVDaemonClient::errorInReply(reply)) {
    std::fprintf(stderr, "%s: %s\n", what, error->description().c_str());
    return true;
  }
  return false;
}

// Sends one find with `send` and waits for its answer: true when a form
// came back (copied to `replyOut` when given).
template <typename Send>
bool findWith(const char* what, Value* replyOut, Send send) {
  platform::dispatch::Semaphore answered;
  bool found = false;
  send([&](const platform::Result<Value>& reply) {
    if (!failed(reply, what)) {
      const Dictionary* body = reply->dictionary();
      found = body != nullptr && body->get(QVDMatchesKey).dictionary() != nullptr;
      if (found && replyOut != nullptr) *replyOut = *reply;
    }
    answered.signal();
  });
  answered.wait();
  return found;
}

}  // namespace

bool findByUuid(QVDaemonClient& client, const platform::Uuid& uuid, Value* replyOut) {
  return findWith("find", replyOut, [&](auto handler) { client.findPlugInByUUID(uuid, handler); });
}

bool findByUuidSynchronously(QVDaemonClient& client, const platform::Uuid& uuid) {
  return findWith("synchronous find", nullptr, [&](auto handler) {
    Dictionary message = client.request(QVDFindRequest);
    message.set(QVDUUIDKey, Value(uuid));
    client.sendSynchronously(QVDSending::Synchronous, std::move(message), handler);
  });
}

bool findByPath(QVDaemonClient& client, const std::string& bundlePath, Value* replyOut) {
  return findWith("find by path", replyOut, [&](auto handler) {
    client.findPlugInByPathURL(QVFileURLFromPath(bundlePath), handler);
  });
}

long match(QVDaemonClient& client, const Dictionary& rules, std::vector<platform::Uuid>* uuidsOut) {
  platform::dispatch::Semaphore answered;
  long forms = -1;
  client.matchPlugIns(rules, 0, [&](const platform::Result<Value>& reply) {
    if (auto error = QVDaemonClient::errorInReply(reply)) {
      // Every form of a large root is more than one message carries; the
      // daemon answers so, and the work up to there is timed all the same.
      if (error->description().find("reply too large") != std::string::npos) {
        forms = -2;
      } else {
        std::fprintf(stderr, "match: %s\n", error->description().c_str());
      }
    } else {
      const Dictionary* body = reply->dictionary();
      const platform::Array* matches = body ? body->get(QVDMatchesKey).array() : nullptr;
      if (matches != nullptr) {
        forms = static_cast<long>(matches->size());
        if (uuidsOut != nullptr) {
          for (const Value& form : *matches) {
            const Dictionary* d = form.dictionary();
            const std::string* text = d ? d->get("uuid").string() : nullptr;
            if (text == nullptr) continue;
            if (auto uuid = platform::Uuid::parse(*text)) uuidsOut->push_back(*uuid);
          }
        }
      }
    }
    answered.signal();
  });
  answered.wait();
  return forms;
}

bool annotate(QVDaemonClient& client, const platform::Uuid& uuid, const Dictionary& annotations) {
  platform::dispatch::Semaphore answered;
  bool ok = false;
  client.setPluginAnnotations({uuid}, annotations, [&](const platform::Result<Value>& reply) {
    ok = !failed(reply, "annotate");
    answered.signal();
  });
  answered.wait();
  return ok;
}

// ---- The table -------------------------------------------------------------

void Table::heading(std::string title) {
  Row row{{std::move(title), "", "", "", ""}, true, section_};
  rows_.push_back(std::move(row));
}

void Table::row(std::string what, std::string figure, std::string against, std::string target,
                std::string verdict) {
  Row row{{std::move(what), std::move(figure), std::move(against), std::move(target),
           std::move(verdict)},
          false,
          section_};
  rows_.push_back(std::move(row));
}

std::string Table::verdict(bool met) {
  ++(met ? met_ : missed_);
  return met ? "met" : "**missed**";
}

std::string Table::markdown() const {
  std::string out = "| measurement | figure | set against | target | |\n|---|---|---|---|---|\n";
  std::vector<Row> rows = rows_;
  std::stable_sort(rows.begin(), rows.end(),
                   [](const Row& a, const Row& b) { return a.section < b.section; });
  for (const Row& row : rows) {
    if (row.heading) {
      out += "| **" + row.cells[0] + "** | | | | |\n";
      continue;
    }
    out += "|";
    for (const std::string& cell : row.cells) out += " " + cell + " |";
    out += "\n";
  }
  return out;
}

}  // namespace bench::suite
