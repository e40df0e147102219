// The Suite behind bench_suite and what its measurement files share: the
// sizes, timing and formatting helpers, and a qvd started on a synthetic
// root with one client of it. Each family of measurements has its own
// file (SuiteMatch, SuiteRoundTrips, SuiteThroughput, SuiteAnnotations,
// SuiteStartup); SuiteMain holds the run, the profile mode and main().
//
// Thread safety: one Suite per process, used from one thread; the helpers
// are plain functions.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstddef>
#include <map>
#include <memory>
#include <optional>
#include <random>
#include <string>
#include <utility>
#include <vector>

#include "Quorvex/QVDaemonClient.h"
#include "bench/match/DaemonProcess.h"
#include "bench/registry/SyntheticRoot.h"
#include "bench/suite/Suite.h"
#include "platform/values/Uuid.h"

namespace bench::suite {

using bench::registry::SyntheticRoot;
using Clock = std::chrono::steady_clock;

inline constexpr std::size_t kPerPoint = 50;
inline constexpr std::size_t kSizes[] = {100, 1'000, 10'000};
inline constexpr std::size_t kLarge = 10'000;
inline constexpr int kAnnotations = 41;

inline double since(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

template <typename Work>
double secondsOf(Work&& work) {
  const auto start = Clock::now();
  work();
  return since(start);
}

// A line on standard error, after "bench_suite: ".
void progress(const char* format, ...) __attribute__((format(printf, 1, 2)));
// The bundle of plug-in `index` in `root`.
std::string bundlePath(const SyntheticRoot& root, std::size_t index);
// "12.3 MiB".
std::string mib(long bytes);
// "4.2x".
std::string ratio(double r);
// "median …, p99 …".
std::string latency(const std::vector<double>& samples);

// A daemon on a root and one client of it. The client goes first, so that
// the daemon's end is not reported as a communications error.
struct Session {
  std::optional<bench::match::DaemonProcess> daemon;
  std::shared_ptr<QVDaemonClient> client;

  ~Session() { stop(); }
  void stop() {
    client.reset();
    daemon.reset();
  }
  pid_t pid() const { return daemon->pid(); }
};

// The daemon's socket in `root`.
std::string socketPath(const SyntheticRoot& root);
// Starts qvd on `root` and waits until it accepts connections.
bool start(const SyntheticRoot& root, Session& session);

// Writes an annotation file holding the first `count` plug-ins' annotations,
// as the daemon itself writes it.
bool seedAnnotations(const SyntheticRoot& root, std::size_t count);

// The match figures at one size, in seconds (medians but the first).
struct MatchFigures {
  double firstAll = 0;
  double all = 0;
  double point = 0;
  double version = 0;
  double scan = 0;
  bool allRefused = false;
  bool versionRefused = false;
};

class Suite {
 public:
  explicit Suite(std::string base) : base_(std::move(base)) {}
  // Every measurement; false when something answered wrongly.
  bool run();
  // For a profiler: a daemon on the 10,000 root with every plug-in cached
  // (and, for "annotate", 10,000 stored annotations) that is sent requests
  // of one kind for `seconds`, its pid printed first. "version" is the
  // version rule, which selects all 10,000 and is refused as too large.
  bool profile(const std::string& kind, double seconds);
  const Table& table() const { return table_; }

 private:
  bool makeRoots(bool largeOnly = false);
  bool matchAt(std::size_t n, Session& session, MatchFigures& out);
  bool largeRoot();
  bool cacheEverything(Session& session);
  bool idleConnections(Session& session);
  bool roundTrips(Session& session);
  bool throughput(Session& session);
  bool annotations();
  void matchRows();
  // The time from starting qvd until a find by path answers.
  bool timedStart(Session& session, double& seconds);

  const std::string base_;
  Table table_;
  std::map<std::size_t, SyntheticRoot> roots_;
  std::map<std::size_t, MatchFigures> matches_;
  std::vector<platform::Uuid> uuids_;  // every plug-in of the large root
  std::mt19937 random_{20240601};

  double firstStart_ = 0;
  std::vector<double> restarts_;
  long idleResident_ = 0;
  long cachedResident_ = 0;
  double perConnection_ = 0;
  std::size_t connections_ = 0;
};

}  // namespace bench::suite
