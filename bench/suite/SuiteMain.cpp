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
#include <stdlib.h>
#include <sys/resource.h>

#include <cstdio>
#include <cstring>
#include <filesystem>
#include <thread>

#include "bench/suite/EchoPeers.h"
#include "bench/suite/SuiteRun.h"

namespace bench::suite {

using platform::Dictionary;

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
  std::snprintf(perConnection, sizeof perConnection, "%.1f KiB", perConnection_ / 1024.0);
  table_.row("per idle connection (" + grouped(static_cast<double>(connections_)) +
                 " connected Unix sockets)",
             perConnection);

  table_.at(6);
  table_.heading(
      "6. start-up with 10,000 plug-ins (until the socket accepts and a find by path answers)");
  table_.row("first start, fresh root (registers every bundle)", duration(firstStart_), "",
             "< 10 s (bench/registry's)", table_.verdict(firstStart_ < 10));
  table_.row("restart, median of 5", duration(percentile(restarts_, 0.5)),
             "fastest " + duration(percentile(restarts_, 0)) + ", slowest " +
                 duration(percentile(restarts_, 1)));
  return true;
}

bool Suite::profile(const std::string& kind, double seconds) {
  if (kind != "find" && kind != "sync-find" && kind != "match" && kind != "version" &&
      kind != "annotate") {
    return false;
  }
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
    } else if (kind == "sync-find") {
      const platform::Uuid& uuid = uuids_[random_() % uuids_.size()];
      samples.push_back(secondsOf([&] { ok = findByUuidSynchronously(*session.client, uuid); }));
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

}  // namespace bench::suite

using bench::suite::runDBusEcho;
using bench::suite::runRawEcho;
using bench::suite::Suite;

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
    std::fprintf(stderr,
                 "usage: bench_suite [--profile find|sync-find|match|version|annotate SECONDS]\n");
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
