// "match" end to end: a real qvd on synthetic roots of 100, 1,000 and
// 10,000 plug-ins (50 per extension point), asked through QVDaemonClient as
// a host asks. Reports medians of a match without rules, of one that
// selects one extension point (50 plug-ins), and of a version-operator rule
// over all, with the growth from 1,000 to 10,000 next to each.
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <filesystem>
#include <map>
#include <string>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVDaemonClient.h"
#include "bench/match/DaemonProcess.h"
#include "bench/registry/Measure.h"
#include "bench/registry/SyntheticRoot.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/root/Root.h"

namespace {

using bench::registry::grouped;
using bench::registry::median;
using bench::registry::millis;
using bench::registry::secondsOf;
using bench::registry::times;
using platform::Dictionary;

constexpr std::size_t kPerPoint = 50;

// Sends one match and waits for it; the number of forms, or -1 on error.
long matchOnce(QVDaemonClient& client, const Dictionary& rules) {
  platform::dispatch::Semaphore answered;
  long forms = -1;
  client.matchPlugIns(rules, 0, [&](const platform::Result<platform::Value>& reply) {
    if (!reply.ok()) {
      std::fprintf(stderr, "match: %s\n", reply.error().description().c_str());
    } else if (auto error = QVDaemonClient::errorInReply(reply)) {
      forms = -2;  // the daemon answered with an error
      if (error->description().find("reply too large") == std::string::npos) {
        std::fprintf(stderr, "match: %s\n", error->description().c_str());
        forms = -1;
      }
    } else {
      const platform::Dictionary* body = reply->dictionary();
      const platform::Array* matches = body ? body->get(QVDMatchesKey).array() : nullptr;
      if (matches) forms = static_cast<long>(matches->size());
    }
    answered.signal();
  });
  answered.wait();
  return forms;
}

struct Figures {
  double firstAll = 0;  // the first match creates every plug-in object
  double all = 0;
  double point = 0;
  double version = 0;
  long residentAfter = -1;
  bool tooLarge = false;  // all forms exceed one message: answered with an error
};

bool measure(const std::string& qvd, const std::string& base, std::size_t plugIns, Figures& out) {
  auto root = bench::registry::SyntheticRoot::make(base + "/n" + std::to_string(plugIns), plugIns,
                                                   plugIns / kPerPoint);
  if (!root.ok()) {
    std::fprintf(stderr, "root: %s\n", root.error().description().c_str());
    return false;
  }
  auto daemon = bench::match::DaemonProcess::start(qvd, root->path());
  if (!daemon.ok()) {
    std::fprintf(stderr, "%s\n", daemon.error().description().c_str());
    return false;
  }
  platform::setRootDirectoryForTesting(root->path());
  auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
  if (!client.ok()) return false;

  const Dictionary none;
  const Dictionary point{{"XOExtensionPointName", bench::registry::SyntheticRoot::pointName(1)}};
  const Dictionary version{{"XOExtensionVersion", ">=1.0"}};
  long forms = 0;
  out.firstAll = secondsOf([&] { forms = matchOnce(**client, none); });
  // Every form of 10,000 plug-ins is more than one message may carry (16
  // MiB): the daemon answers with an error, which is timed all the same.
  out.tooLarge = forms == -2;
  const long wanted = out.tooLarge ? -2 : static_cast<long>(plugIns);
  if (forms != wanted) {
    std::fprintf(stderr, "match without rules gave %ld forms of %zu\n", forms, plugIns);
    return false;
  }
  const int rounds = plugIns >= 10'000 ? 3 : 15;
  std::vector<double> all, one, versions;
  for (int i = 0; i < rounds; ++i) {
    all.push_back(secondsOf([&] { forms = matchOnce(**client, none); }));
    if (forms != wanted) return false;
    versions.push_back(secondsOf([&] { forms = matchOnce(**client, version); }));
    if (forms != wanted) return false;
    for (int j = 0; j < 10; ++j) {
      one.push_back(secondsOf([&] { forms = matchOnce(**client, point); }));
      if (forms != static_cast<long>(kPerPoint)) {
        std::fprintf(stderr, "point match gave %ld forms\n", forms);
        return false;
      }
    }
  }
  out.all = median(all);
  out.point = median(one);
  out.version = median(versions);
  out.residentAfter = daemon->residentBytes();
  return true;
}

// For a profiler: a daemon on a root of `plugIns`, asked `rounds` times for
// every form and then for one extension point's, with its pid printed first
// so that `perf record -p` can attach.
int profile(const std::string& qvd, const std::string& base, std::size_t plugIns, int rounds) {
  auto root = bench::registry::SyntheticRoot::make(base + "/profile", plugIns,
                                                   std::max<std::size_t>(1, plugIns / kPerPoint));
  if (!root.ok()) return 1;
  auto daemon = bench::match::DaemonProcess::start(qvd, root->path());
  if (!daemon.ok()) return 1;
  platform::setRootDirectoryForTesting(root->path());
  auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
  if (!client.ok()) return 1;
  const Dictionary none;
  const Dictionary point{{"XOExtensionPointName", bench::registry::SyntheticRoot::pointName(1)}};
  matchOnce(**client, none);
  std::printf("qvd pid %d\n", static_cast<int>(daemon->pid()));
  std::fflush(stdout);
  std::vector<double> all, one;
  for (int i = 0; i < rounds; ++i) all.push_back(secondsOf([&] { matchOnce(**client, none); }));
  for (int i = 0; i < rounds; ++i) one.push_back(secondsOf([&] { matchOnce(**client, point); }));
  std::printf("no rules %.3f ms, one extension point %.3f ms (medians of %d)\n",
              median(all) * 1e3, median(one) * 1e3, rounds);
  return 0;
}

}  // namespace

// bench_match                      the table
// bench_match --profile N ROUNDS   one root of N plug-ins, for a profiler
int main(int argc, char** argv) {
  const char* tmp = std::getenv("TMPDIR");
  std::string base = std::string(tmp ? tmp : "/tmp") + "/qv-match-bench-XXXXXX";
  if (::mkdtemp(base.data()) == nullptr) return 1;
  if (argc == 4 && std::string(argv[1]) == "--profile") {
    const int status = profile(QVD_PATH, base, std::strtoul(argv[2], nullptr, 10),
                               static_cast<int>(std::strtol(argv[3], nullptr, 10)));
    std::error_code ignored;
    std::filesystem::remove_all(base, ignored);
    return status;
  }
  std::map<std::size_t, Figures> figures;
  bool ok = true;
  for (std::size_t n : {100, 1'000, 10'000}) {
    if (!measure(QVD_PATH, base, n, figures[n])) {
      ok = false;
      break;
    }
  }
  if (!ok) {
    std::fprintf(stderr, "kept %s for a look (each root has its qvd.log)\n", base.c_str());
    return 1;
  }
  std::error_code ignored;
  std::filesystem::remove_all(base, ignored);

  bench::registry::Table table;
  table.section("match through QVDaemonClient (medians; 50 plug-ins per extension point)");
  for (const auto& [n, f] : figures) {
    table.add("no rules, " + grouped(n) + ", first (creates the plug-ins)", millis(f.firstAll));
    table.add("no rules, " + grouped(n), millis(f.all),
              f.tooLarge ? "refused: the forms exceed one 16 MiB message" :
              n == 1'000 ? (f.all < 0.050 ? "target < 50 ms: met" : "target < 50 ms: MISSED")
                         : "");
    table.add("one extension point (50 of " + grouped(n) + ")", millis(f.point),
              n == 10'000 ? (f.point < 0.005 ? "target < 5 ms: met" : "target < 5 ms: MISSED")
                          : "");
    table.add("XOExtensionVersion >=1.0 (all of " + grouped(n) + ")", millis(f.version));
    table.add("  daemon resident memory afterwards",
              bench::registry::format("%.1f MiB", f.residentAfter / 1048576.0));
  }
  const Figures& k1 = figures[1'000];
  const Figures& k10 = figures[10'000];
  table.section("growth from 1,000 to 10,000 plug-ins (linear: 10x or less)");
  table.add("no rules", times(k10.all / k1.all), k10.all / k1.all <= 11 ? "met" : "MISSED");
  table.add("one extension point (50 either way)", times(k10.point / k1.point),
            "near 1: the point's plug-ins only");
  table.add("version rule", times(k10.version / k1.version),
            k10.version / k1.version <= 11 ? "met" : "MISSED");
  table.print();
  return 0;
}
