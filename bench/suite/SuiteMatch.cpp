// Measures "match" at each root size (no rules, one extension point, the
// version rule) next to a host's own scan of every Info.vmap.
#include "bench/suite/HostScan.h"
#include "bench/suite/SuiteRun.h"

namespace bench::suite {

using platform::Dictionary;

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

}  // namespace bench::suite
