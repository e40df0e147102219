// bench_suite: the figures of bench/run in one process, printed as one
// markdown table. It writes synthetic platform roots of 100, 1,000 and
// 10,000 plug-ins (50 per extension point), starts a real qvd on each and
// asks it as a host does, through QVDaemonClient:
//
//   - "find" round trips next to a raw Unix-socket ping-pong of the same
//     bytes and a method call through a private D-Bus session bus;
//   - "match" at each size, next to a host scanning every Info.vmap itself;
//   - requests per second with 1, 4 and 16 client threads;
//   - "annotate" with 10, 1,000 and 10,000 stored annotations;
//   - the daemon's memory at idle, with every plug-in cached, and per idle
//     connection;
//   - the daemon's first start on the fresh 10,000 root and its restarts.
//
// Progress goes to standard error, the table to standard output. The run
// fails (status 1) when a request answers wrongly; a missed target does not
// fail it: the table says so.
//
//   bench_suite                                  the whole run
//   bench_suite --profile KIND SECONDS           one kind of request for a
//                                                profiler (find, match, version,
//                                                annotate)
//   bench_suite --raw-echo PATH REQ REPLY        helper: the raw socket peer
//   bench_suite --dbus-echo ADDRESS REPLY        helper: the D-Bus echo service
#include <errno.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <atomic>
#include <cstdarg>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <map>
#include <optional>
#include <random>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "bench/match/DaemonProcess.h"
#include "bench/registry/SyntheticRoot.h"
#include "bench/suite/EchoPeers.h"
#include "bench/suite/HostScan.h"
#include "bench/suite/Suite.h"
#include "platform/mbx/Frame.h"
#include "platform/root/Root.h"
#include "platform/vmap/Writer.h"

namespace {

using namespace bench::suite;
using bench::registry::SyntheticRoot;
using platform::Dictionary;
using platform::Value;
using Clock = std::chrono::steady_clock;

constexpr std::size_t kPerPoint = 50;
constexpr std::size_t kSizes[] = {100, 1'000, 10'000};
constexpr std::size_t kLarge = 10'000;
constexpr int kAnnotations = 41;

double since(Clock::time_point start) {
  return std::chrono::duration<double>(Clock::now() - start).count();
}

template <typename Work>
double secondsOf(Work&& work) {
  const auto start = Clock::now();
  work();
  return since(start);
}

void progress(const char* format, ...) __attribute__((format(printf, 1, 2)));
void progress(const char* format, ...) {
  va_list args;
  va_start(args, format);
  std::fprintf(stderr, "bench_suite: ");
  std::vfprintf(stderr, format, args);
  std::fprintf(stderr, "\n");
  va_end(args);
}

std::string bundlePath(const SyntheticRoot& root, std::size_t index) {
  return root.path() + "/System/Library/PlugIns/" +
         SyntheticRoot::pointName(index / root.plugInsPerPoint()) + "-" + std::to_string(index) +
         ".ovx";
}

std::string mib(long bytes) {
  char text[32];
  std::snprintf(text, sizeof text, "%.1f MiB", static_cast<double>(bytes) / 1048576.0);
  return text;
}

std::string ratio(double r) {
  char text[32];
  std::snprintf(text, sizeof text, "%.1fx", r);
  return text;
}

std::string latency(const std::vector<double>& samples) {
  return "median " + duration(percentile(samples, 0.5)) + ", p99 " +
         duration(percentile(samples, 0.99));
}

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

std::string socketPath(const SyntheticRoot& root) {
  return root.path() + "/run/quorvex/mbx/" + std::string(QVDServiceName);
}

// Starts qvd on `root` and waits until it accepts connections.
bool start(const SyntheticRoot& root, Session& session) {
  platform::setRootDirectoryForTesting(root.path());
  auto daemon = bench::match::DaemonProcess::start(QVD_PATH, root.path());
  if (!daemon.ok()) {
    progress("%s", daemon.error().description().c_str());
    return false;
  }
  session.daemon.emplace(std::move(*daemon));
  auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
  if (!client.ok()) return false;
  session.client = *client;
  return true;
}

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

bool Suite::makeRoots(bool largeOnly) {
  for (std::size_t n : kSizes) {
    if (largeOnly && n != kLarge) continue;
    const double took = secondsOf([&] {
      auto root = SyntheticRoot::make(base_ + "/root" + std::to_string(n), n, n / kPerPoint);
      if (root.ok()) {
        roots_.emplace(n, std::move(*root));
      } else {
        progress("root: %s", root.error().description().c_str());
      }
    });
    if (!roots_.contains(n)) return false;
    progress("root of %zu plug-ins written in %.2f s", n, took);
  }
  return true;
}

bool Suite::timedStart(Session& session, double& seconds) {
  const SyntheticRoot& root = roots_.at(kLarge);
  const auto begin = Clock::now();
  if (!start(root, session)) return false;
  if (!findByPath(*session.client, bundlePath(root, 0))) return false;
  seconds = since(begin);
  return true;
}

bool Suite::matchAt(std::size_t n, Session& session, MatchFigures& out) {
  const SyntheticRoot& root = roots_.at(n);
  const std::size_t points = root.points();
  const Dictionary none;
  const Dictionary version{{"XOExtensionVersion", ">=1.0"}};
  auto point = [](std::size_t p) {
    return Dictionary{{"XOExtensionPointName", SyntheticRoot::pointName(p)}};
  };
  long forms = 0;
  out.firstAll = secondsOf([&] { forms = match(*session.client, none); });
  out.allRefused = forms == -2;
  const long everything = out.allRefused ? -2 : static_cast<long>(n);
  if (forms != everything) {
    progress("match without rules gave %ld forms of %zu", forms, n);
    return false;
  }
  const int rounds = n >= kLarge ? 7 : 15;
  std::vector<double> all, one, versions, scans;
  for (int i = 0; i < rounds; ++i) {
    all.push_back(secondsOf([&] { forms = match(*session.client, none); }));
    if (forms != everything) return false;
    versions.push_back(secondsOf([&] { forms = match(*session.client, version); }));
    out.versionRefused = forms == -2;
    if (forms != static_cast<long>(n) && forms != -2) return false;
    for (int j = 0; j < 10; ++j) {
      const Dictionary rules = point(random_() % points);
      one.push_back(secondsOf([&] { forms = match(*session.client, rules); }));
      if (forms != static_cast<long>(kPerPoint)) {
        progress("point match gave %ld forms", forms);
        return false;
      }
    }
  }
  for (int i = 0; i < rounds; ++i) {
    const std::string name = SyntheticRoot::pointName(random_() % points);
    platform::Result<std::size_t> found(std::size_t{0});
    scans.push_back(secondsOf([&] { found = scanForPoint(root.path(), name); }));
    if (!found.ok() || *found != kPerPoint) {
      progress("scan found %zu", found.ok() ? *found : 0);
      return false;
    }
  }
  out.all = percentile(all, 0.5);
  out.point = percentile(one, 0.5);
  out.version = percentile(versions, 0.5);
  out.scan = percentile(scans, 0.5);
  return true;
}

void Suite::matchRows() {
  table_.at(2);
  table_.heading("2. match through QVDaemonClient (medians; 50 plug-ins per extension point)");
  for (std::size_t n : kSizes) {
    const MatchFigures& f = matches_.at(n);
    const std::string size = grouped(static_cast<double>(n));
    table_.row("no rules, " + size + " plug-ins", duration(f.all),
               "first match (creates the plug-in objects): " + duration(f.firstAll) +
                   (f.allRefused ? "; refused: the forms exceed one 16 MiB message" : ""));
    const bool large = n == kLarge;
    table_.row("extension point, 50 of " + size, duration(f.point),
               "host scan of every Info.vmap: " + duration(f.scan) + " (" +
                   ratio(f.scan / f.point) + " the match)",
               large ? "< 5 ms" : "", large ? table_.verdict(f.point < 0.005) : "");
    table_.row("`XOExtensionVersion` `>=1.0` (all " + size + ")", duration(f.version),
               f.versionRefused ? "refused: the forms exceed one 16 MiB message" : "");
  }
  const MatchFigures& k1 = matches_.at(1'000);
  const MatchFigures& k10 = matches_.at(kLarge);
  table_.row("extension point at 10,000: host scan / match", ratio(k10.scan / k10.point),
             duration(k10.scan) + " / " + duration(k10.point), ">= 20x",
             table_.verdict(k10.scan / k10.point >= 20));
  // Linear: ten times the plug-ins at most ten times the time; a tenth
  // more is allowed for noise on a shared machine.
  table_.row("growth 1,000 -> 10,000: no rules", ratio(k10.all / k1.all),
             duration(k1.all) + " -> " + duration(k10.all), "<= ~10x (11x)",
             table_.verdict(k10.all / k1.all <= 11));
  table_.row("growth 1,000 -> 10,000: version rule", ratio(k10.version / k1.version),
             duration(k1.version) + " -> " + duration(k10.version), "<= ~10x (11x)",
             table_.verdict(k10.version / k1.version <= 11));
  table_.row("growth 1,000 -> 10,000: extension point (50 either way)",
             ratio(k10.point / k1.point), duration(k1.point) + " -> " + duration(k10.point),
             "<= ~10x (11x)", table_.verdict(k10.point / k1.point <= 11));
  table_.row("growth 1,000 -> 10,000: host scan", ratio(k10.scan / k1.scan),
             duration(k1.scan) + " -> " + duration(k10.scan));
}

// Every point's match once: every plug-in object is then cached, and the
// UUIDs are known.
bool Suite::cacheEverything(Session& session) {
  const SyntheticRoot& root = roots_.at(kLarge);
  uuids_.clear();
  for (std::size_t p = 0; p < root.points(); ++p) {
    const Dictionary rules{{"XOExtensionPointName", SyntheticRoot::pointName(p)}};
    if (match(*session.client, rules, &uuids_) != static_cast<long>(kPerPoint)) return false;
  }
  return uuids_.size() == kLarge;
}

bool Suite::idleConnections(Session& session) {
  constexpr std::size_t kConnections = 1'000;
  const pid_t pid = session.pid();
  const long descriptorsBefore = openDescriptors(pid);
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  const long before = residentBytes(pid);
  const std::string path = socketPath(roots_.at(kLarge));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  std::vector<int> fds;
  for (std::size_t i = 0; i < kConnections; ++i) {
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0 || ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
      progress("connection %zu: %s", i, std::strerror(errno));
      if (fd >= 0) ::close(fd);
      break;
    }
    fds.push_back(fd);
  }
  // Accepted once the daemon holds a descriptor for each.
  const auto deadline = Clock::now() + std::chrono::seconds(30);
  while (openDescriptors(pid) < descriptorsBefore + static_cast<long>(fds.size()) &&
         Clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  const bool accepted = openDescriptors(pid) >= descriptorsBefore + static_cast<long>(fds.size());
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  const long after = residentBytes(pid);
  connections_ = fds.size();
  perConnection_ = fds.empty() ? 0 : static_cast<double>(after - before) / static_cast<double>(fds.size());
  for (int fd : fds) ::close(fd);
  const auto gone = Clock::now() + std::chrono::seconds(30);
  while (openDescriptors(pid) > descriptorsBefore && Clock::now() < gone) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  if (!accepted) progress("the daemon did not take all %zu connections", fds.size());
  return accepted && fds.size() == kConnections;
}

bool Suite::roundTrips(Session& session) {
  // The sizes the raw and D-Bus peers send: those of a find request and of
  // its reply (a plug-in form) as mbx frames.
  const platform::Uuid& probe = uuids_.front();
  Dictionary request = session.client->request(QVDFindRequest);
  request.set(QVDUUIDKey, Value(probe));
  Value reply;
  if (!findByUuid(*session.client, probe, &reply)) return false;
  auto requestFrame = platform::mbx::encodeFrame(platform::mbx::FrameKind::Request, 0, Value(request));
  auto replyFrame = platform::mbx::encodeFrame(platform::mbx::FrameKind::Reply, 1, reply);
  if (!requestFrame.ok() || !replyFrame.ok()) return false;
  const std::size_t requestBytes = requestFrame->size();
  const std::size_t replyBytes = replyFrame->size();

  const std::string self = selfPath();
  const std::string rawPath = base_ + "/raw.sock";
  auto rawPeer = Helper::start({self, "--raw-echo", rawPath, std::to_string(requestBytes),
                                std::to_string(replyBytes)});
  if (!rawPeer.ok() || (*rawPeer)->readLine(10) != "ready") return false;
  auto raw = RawPingPong::connect(rawPath, requestBytes, replyBytes);
  if (!raw.ok()) return false;

  std::unique_ptr<PrivateBus> bus;
  std::unique_ptr<Helper> echo;
  std::unique_ptr<DBusCaller> caller;
  std::string dbusProblem;
  if (!dbusAvailable()) {
    dbusProblem = "not measured: built without libdbus-1-dev";
  } else if (auto started = PrivateBus::start(base_); !started.ok()) {
    dbusProblem = "not measured: " + started.error().description();
  } else {
    bus = std::move(*started);
    auto service = Helper::start({self, "--dbus-echo", bus->address(), std::to_string(replyBytes)});
    if (!service.ok() || (*service)->readLine(10) != "ready") {
      dbusProblem = "not measured: the echo service did not start";
    } else {
      echo = std::move(*service);
      auto connected = DBusCaller::connect(bus->address(), requestBytes);
      if (connected.ok()) {
        caller = std::move(*connected);
      } else {
        dbusProblem = "not measured: " + connected.error().description();
      }
    }
  }

  std::vector<pid_t> processes{0, session.pid(), (*rawPeer)->pid()};
  if (caller) {
    processes.push_back(bus->pid());
    processes.push_back(echo->pid());
  }
  auto affinity = [&](const cpu_set_t& cpus) {
    for (pid_t pid : processes) setProcessAffinity(pid, cpus);
  };

  struct Samples {
    std::vector<double> raw, find, dbus;
  };
  bool ok = true;
  // Rounds of each kind in turn, so that whatever else the machine does
  // falls on all three alike.
  auto measure = [&](int rounds, int perRound, Samples& samples) {
    for (int i = 0; i < 300; ++i) {
      ok = ok && (*raw)->once() &&
           findByUuid(*session.client, uuids_[random_() % uuids_.size()]) &&
           (!caller || caller->once());
    }
    for (int round = 0; round < rounds && ok; ++round) {
      for (int i = 0; i < perRound && ok; ++i) {
        samples.raw.push_back(secondsOf([&] { ok = (*raw)->once(); }));
      }
      for (int i = 0; i < perRound && ok; ++i) {
        const platform::Uuid& uuid = uuids_[random_() % uuids_.size()];
        samples.find.push_back(secondsOf([&] { ok = findByUuid(*session.client, uuid); }));
      }
      for (int i = 0; caller && i < perRound && ok; ++i) {
        samples.dbus.push_back(secondsOf([&] { ok = caller->once(); }));
      }
    }
  };
  const cpu_set_t all = allowedCpus();
  // Everything on one CPU: in a VM, waking an idle second vCPU costs tens
  // of microseconds per hop, which would swamp what is measured.
  Samples pinned;
  affinity(firstCpu());
  measure(5, 2'000, pinned);
  affinity(all);
  Samples spread;
  measure(3, 1'000, spread);
  if (!ok) {
    progress("a round trip failed");
    return false;
  }

  char sizes[96];
  std::snprintf(sizes, sizeof sizes, "%zu-byte request, %zu-byte reply", requestBytes, replyBytes);
  table_.at(1);
  table_.heading(std::string("1. \"find\" by UUID through QVDaemonClient, round trip (") + sizes +
                 "; 10,000 each, every process on one CPU)");
  const double find = percentile(pinned.find, 0.5);
  const double rawMedian = percentile(pinned.raw, 0.5);
  table_.row("raw Unix-socket ping-pong, same bytes (the limit)", latency(pinned.raw));
  table_.row("find", latency(pinned.find), ratio(find / rawMedian) + " the raw ping-pong",
             "<= 3x raw", table_.verdict(find <= 3 * rawMedian));
  if (caller) {
    const double dbus = percentile(pinned.dbus, 0.5);
    table_.row("D-Bus method call, same bytes (libdbus-1, private dbus-daemon)",
               latency(pinned.dbus), "find takes " + ratio(find / dbus) + " the call's time",
               "find faster", table_.verdict(find < dbus));
  } else {
    table_.row("D-Bus method call", dbusProblem, "", "find faster", "not measured");
  }
  table_.heading("1b. the same, processes free to use both CPUs (3,000 each)");
  table_.row("raw Unix-socket ping-pong", latency(spread.raw));
  table_.row("find", latency(spread.find),
             ratio(percentile(spread.find, 0.5) / percentile(spread.raw, 0.5)) + " the raw ping-pong");
  if (caller) {
    table_.row("D-Bus method call", latency(spread.dbus),
               "find takes " +
                   ratio(percentile(spread.find, 0.5) / percentile(spread.dbus, 0.5)) +
                   " the call's time");
  }
  return true;
}

bool Suite::throughput(Session& session) {
  const std::size_t points = roots_.at(kLarge).points();
  constexpr double kWarm = 0.5;
  constexpr double kWindow = 5.0;
  struct Level {
    int clients;
    double perSecond;
    double median;
    double findMedian;
    double matchMedian;
    double daemonCpu;
  };
  std::vector<Level> levels;
  for (int clients : {1, 4, 16}) {
    std::vector<std::shared_ptr<QVDaemonClient>> connections;
    for (int i = 0; i < clients; ++i) {
      auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
      if (!client.ok()) return false;
      connections.push_back(*client);
    }
    std::atomic<bool> stop{false};
    std::atomic<long> failures{0};
    struct Done {
      double end;
      double took;
      bool find;
    };
    std::vector<std::vector<Done>> done(static_cast<std::size_t>(clients));
    const auto begin = Clock::now();
    std::vector<std::thread> threads;
    for (int t = 0; t < clients; ++t) {
      threads.emplace_back([&, t] {
        std::mt19937 random(static_cast<unsigned>(t) * 7919u + 1u);
        QVDaemonClient& client = *connections[static_cast<std::size_t>(t)];
        for (long i = 0; !stop.load(std::memory_order_relaxed); ++i) {
          const auto sent = Clock::now();
          bool ok;
          if (i % 2 == 0) {
            ok = findByUuid(client, uuids_[random() % uuids_.size()]);
          } else {
            const Dictionary rules{{"XOExtensionPointName", SyntheticRoot::pointName(random() % points)}};
            ok = match(client, rules) == static_cast<long>(kPerPoint);
          }
          if (!ok) ++failures;
          done[static_cast<std::size_t>(t)].push_back({since(begin), since(sent), i % 2 == 0});
        }
      });
    }
    std::this_thread::sleep_until(begin + std::chrono::milliseconds(static_cast<int>(kWarm * 1e3)));
    const double cpuBefore = cpuSeconds(session.pid());
    std::this_thread::sleep_until(begin + std::chrono::milliseconds(static_cast<int>((kWarm + kWindow) * 1e3)));
    const double cpuAfter = cpuSeconds(session.pid());
    stop = true;
    for (std::thread& thread : threads) thread.join();
    if (failures.load() != 0) {
      progress("%ld requests failed with %d clients", failures.load(), clients);
      return false;
    }
    std::vector<double> latencies, finds, matches;
    for (const auto& one : done) {
      for (const Done& request : one) {
        if (request.end < kWarm || request.end >= kWarm + kWindow) continue;
        latencies.push_back(request.took);
        (request.find ? finds : matches).push_back(request.took);
      }
    }
    levels.push_back({clients, static_cast<double>(latencies.size()) / kWindow,
                      percentile(latencies, 0.5), percentile(finds, 0.5),
                      percentile(matches, 0.5), (cpuAfter - cpuBefore) / kWindow});
    progress("%d clients: %.0f requests/s", clients, levels.back().perSecond);
  }

  table_.at(3);
  table_.heading("3. throughput: find (UUID) and match (one extension point) alternating, 10,000 "
                 "plug-ins, client threads in one process, 5 s each");
  for (std::size_t i = 0; i < levels.size(); ++i) {
    const Level& level = levels[i];
    char cpu[64];
    std::snprintf(cpu, sizeof cpu, "; qvd used %.0f%% of a CPU", level.daemonCpu * 100);
    std::string against = "median " + duration(level.median) + " per request (find " +
                          duration(level.findMedian) + ", match " +
                          duration(level.matchMedian) + ")" + cpu;
    if (i > 0) against += "; " + ratio(level.perSecond / levels[i - 1].perSecond) + " the rate of " +
                          std::to_string(levels[i - 1].clients);
    table_.row(std::to_string(level.clients) + (level.clients == 1 ? " client" : " clients"),
               grouped(level.perSecond) + " requests/s", against);
  }
  // Saturated where more clients no longer buy a tenth more requests.
  std::string where = "not saturated by 16 clients";
  for (std::size_t i = 1; i < levels.size(); ++i) {
    if (levels[i].perSecond < 1.1 * levels[i - 1].perSecond) {
      char text[200];
      std::snprintf(text, sizeof text,
                    "saturated at %d client%s: %d give %.2fx the rate; qvd at %.0f%% of a CPU "
                    "(its service queue runs one request at a time), the machine has %ld",
                    levels[i - 1].clients, levels[i - 1].clients == 1 ? "" : "s",
                    levels[i].clients,
                    levels[i].perSecond / levels[i - 1].perSecond, levels[i].daemonCpu * 100,
                    ::sysconf(_SC_NPROCESSORS_ONLN));
      where = text;
      break;
    }
  }
  table_.row("where the service queue saturates", where);
  return true;
}

// Writes an annotation file holding the first `count` plug-ins' annotations,
// as the daemon itself writes it.
bool seedAnnotations(const SyntheticRoot& root, std::size_t count) {
  Dictionary data;
  data.reserve(count);
  for (std::size_t i = 0; i < count; ++i) {
    char identifier[64];
    std::snprintf(identifier, sizeof identifier, "com.corvane.bench.plugin%05zu", i);
    data.set(identifier,
             Dictionary{{"election", 1},
                        {"extension", Dictionary{{"pinned", i % 3 == 0},
                                                 {"lastUsed", static_cast<std::int64_t>(i)}}}});
  }
  const Value file(Dictionary{{"version", 16}, {"data", std::move(data)}});
  auto text = platform::vmap::write(file, platform::vmap::Format::Xml);
  if (!text.ok()) return false;
  std::filesystem::create_directories(root.path() + "/var/db");
  std::ofstream out(root.path() + "/var/db/Quorvex-Annotations", std::ios::trunc);
  out << *text;
  return static_cast<bool>(out);
}

bool Suite::annotations() {
  const SyntheticRoot& root = roots_.at(kLarge);
  const std::string file = root.path() + "/var/db/Quorvex-Annotations";
  table_.at(4);
  table_.heading("4. \"annotate\" of one plug-in (each rewrites and fsyncs the annotation file), "
                 "10,000 plug-ins; 41 requests each");
  for (std::size_t annotated : {std::size_t{10}, std::size_t{1'000}, kLarge}) {
    if (!seedAnnotations(root, annotated)) return false;
    Session session;
    if (!start(root, session)) return false;
    Value found;
    if (!findByPath(*session.client, bundlePath(root, 0), &found)) return false;
    const Dictionary* form = found.dictionary()->get(QVDMatchesKey).dictionary();
    auto uuid = platform::Uuid::parse(form->get("uuid").string() ? *form->get("uuid").string() : "");
    if (!uuid) return false;
    std::vector<double> samples;
    std::int64_t election = 0;
    for (int i = 0; i < kAnnotations; ++i) {
      election = i % 2;
      const Dictionary change{{"election", election}};
      bool ok = false;
      samples.push_back(secondsOf([&] { ok = annotate(*session.client, *uuid, change); }));
      if (!ok) return false;
    }
    // The last change is in the form, and the stored extension entry stayed.
    if (!findByPath(*session.client, bundlePath(root, 0), &found)) return false;
    const Dictionary* annotation =
        found.dictionary()->get(QVDMatchesKey).dictionary()->get("annotations").dictionary();
    if (annotation == nullptr || annotation->get("election").int64() != election ||
        annotation->get("extension").dictionary() == nullptr) {
      progress("the annotation did not land");
      return false;
    }
    struct stat status {};
    ::stat(file.c_str(), &status);
    table_.row(grouped(static_cast<double>(annotated)) + " annotated plug-ins",
               duration(percentile(samples, 0.5)),
               "p99 " + duration(percentile(samples, 0.99)) + "; file of " +
                   grouped(static_cast<double>(status.st_size)) + " bytes");
    progress("annotate with %zu annotated: %.2f ms", annotated, percentile(samples, 0.5) * 1e3);
  }
  return true;
}

bool Suite::largeRoot() {
  const SyntheticRoot& root = roots_.at(kLarge);
  {
    // The first start registers every bundle of the fresh root.
    Session session;
    if (!timedStart(session, firstStart_)) return false;
    progress("first start on 10,000: %.2f s", firstStart_);
    if (!matchAt(kLarge, session, matches_[kLarge])) return false;
  }
  Session session;
  for (int i = 0; i < 5; ++i) {
    session.stop();
    double seconds = 0;
    if (!timedStart(session, seconds)) return false;
    restarts_.push_back(seconds);
  }
  progress("restart: %.2f s", percentile(restarts_, 0.5));
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  idleResident_ = residentBytes(session.pid());
  if (!cacheEverything(session)) {
    progress("could not match every extension point");
    return false;
  }
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  cachedResident_ = residentBytes(session.pid());
  if (!idleConnections(session)) return false;
  progress("memory measured");
  if (!roundTrips(session)) return false;
  progress("round trips measured");
  if (!throughput(session)) return false;
  (void)root;
  return true;
}

bool Suite::run() {
  if (!makeRoots()) return false;
  for (std::size_t n : {std::size_t{100}, std::size_t{1'000}}) {
    Session session;
    if (!start(roots_.at(n), session)) return false;
    if (!matchAt(n, session, matches_[n])) return false;
    progress("match at %zu measured", n);
  }
  if (!largeRoot()) return false;
  matchRows();
  if (!annotations()) return false;

  table_.at(5);
  table_.heading("5. memory: qvd resident set, 10,000 registered plug-ins");
  table_.row("idle (after a restart and one find)", mib(idleResident_));
  table_.row("10,000 plug-ins cached (after a match of every extension point)",
             mib(cachedResident_),
             grouped((static_cast<double>(cachedResident_ - idleResident_)) / kLarge) +
                 " bytes per cached plug-in");
  char perConnection[64];
  std::snprintf(perConnection, sizeof perConnection, "%.1f KiB",
                perConnection_ / 1024.0);
  table_.row("per idle connection (" + grouped(static_cast<double>(connections_)) +
                 " connected Unix sockets)",
             perConnection);

  table_.at(6);
  table_.heading("6. start-up with 10,000 plug-ins (until the socket accepts and a find by path answers)");
  table_.row("first start, fresh root (registers every bundle)", duration(firstStart_), "",
             "< 10 s (bench/registry's)", table_.verdict(firstStart_ < 10));
  table_.row("restart, median of 5", duration(percentile(restarts_, 0.5)),
             "fastest " + duration(percentile(restarts_, 0)) + ", slowest " +
                 duration(percentile(restarts_, 1)));
  return true;
}

bool Suite::profile(const std::string& kind, double seconds) {
  if (kind != "find" && kind != "match" && kind != "version" && kind != "annotate") return false;
  if (!makeRoots(true)) return false;
  const SyntheticRoot& root = roots_.at(kLarge);
  if (kind == "annotate" && !seedAnnotations(root, kLarge)) return false;
  Session session;
  if (!start(root, session) || !cacheEverything(session)) return false;
  std::printf("qvd pid %d\n", static_cast<int>(session.pid()));
  std::fflush(stdout);
  std::this_thread::sleep_for(std::chrono::seconds(1));  // time to attach
  std::vector<double> samples;
  const auto begin = Clock::now();
  bool ok = true;
  for (long i = 0; ok && since(begin) < seconds; ++i) {
    if (kind == "find") {
      const platform::Uuid& uuid = uuids_[random_() % uuids_.size()];
      samples.push_back(secondsOf([&] { ok = findByUuid(*session.client, uuid); }));
    } else if (kind == "match") {
      const Dictionary rules{
          {"XOExtensionPointName", SyntheticRoot::pointName(random_() % root.points())}};
      samples.push_back(secondsOf([&] { ok = match(*session.client, rules) == 50; }));
    } else if (kind == "version") {
      const Dictionary rules{{"XOExtensionVersion", ">=1.0"}};
      samples.push_back(secondsOf([&] { ok = match(*session.client, rules) == -2; }));
    } else {
      const Dictionary change{{"election", i % 2}};
      samples.push_back(secondsOf([&] { ok = annotate(*session.client, uuids_[0], change); }));
    }
  }
  std::printf("%zu %s requests, %s\n", samples.size(), kind.c_str(), latency(samples).c_str());
  return ok;
}

}  // namespace

int main(int argc, char** argv) {
  if (argc == 5 && std::strcmp(argv[1], "--raw-echo") == 0) {
    return runRawEcho(argv[2], std::strtoul(argv[3], nullptr, 10),
                      std::strtoul(argv[4], nullptr, 10));
  }
  if (argc == 4 && std::strcmp(argv[1], "--dbus-echo") == 0) {
    return runDBusEcho(argv[2], std::strtoul(argv[3], nullptr, 10));
  }
  const bool profiling = argc == 4 && std::strcmp(argv[1], "--profile") == 0;
  if (argc != 1 && !profiling) {
    std::fprintf(stderr, "usage: bench_suite [--profile find|match|version|annotate SECONDS]\n");
    return 2;
  }
  // Before anything logs: the daemon's and the client's notices would
  // otherwise be written for every request.
  ::setenv("QV_LOG", "error", 0);
  // A descriptor per idle connection, on both sides (qvd inherits it).
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);

  const char* tmp = std::getenv("TMPDIR");
  std::string base = std::string(tmp ? tmp : "/tmp") + "/qv-suite-XXXXXX";
  if (::mkdtemp(base.data()) == nullptr) return 1;
  Suite suite(base);
  if (profiling) {
    const bool ok = suite.profile(argv[2], std::strtod(argv[3], nullptr));
    std::error_code ignored;
    std::filesystem::remove_all(base, ignored);
    return ok ? 0 : 1;
  }
  const bool ok = suite.run();
  if (!ok) {
    std::fprintf(stderr, "bench_suite: failed; kept %s for a look (each root has its qvd.log)\n",
                 base.c_str());
    return 1;
  }
  std::error_code ignored;
  std::filesystem::remove_all(base, ignored);
  std::printf("%s", suite.table().markdown().c_str());
  std::printf("\n%d targets met, %d missed.\n", suite.table().met(), suite.table().missed());
  return 0;
}
