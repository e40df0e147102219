// What the registration database and the plug-in database cost at the size
// of a full device: 10,000 plug-ins over 200 extension points (50 each),
// next to 1,000 over 20 (the same 50 each), so that the growth with the
// total is read off ratios taken in one run:
//
//   - start-up: LinuxRegistry::open with the start-up pass on a fresh root
//     (every bundle read and stored) and on the same root again (restart);
//   - queries: QVDatabase::findPlugIns of everything and of one extension
//     point, and the registry's queryPlugIns under them, at both sizes;
//   - the cache: resident memory per cached plug-in, and a look-up by UUID
//     that creates the plug-in against one that finds it cached.
//
// Query medians are taken in interleaved rounds (1,000 then 10,000, each
// round) so that a noisy neighbour slows both sizes alike.
//
// The plug-in database checks a new plug-in against the process's platform
// root, so the root is switched to the synthetic root whose plug-ins are
// about to be created, always while no other work runs.
#include <stdlib.h>

#include <cstdio>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "bench/registry/BenchDatabase.h"
#include "bench/registry/Measure.h"
#include "bench/registry/QueryRounds.h"
#include "bench/registry/SyntheticRoot.h"
#include "platform/root/Root.h"

namespace {

using namespace bench::registry;
using platform::holvane::LinuxRegistry;

constexpr std::size_t kLarge = 10'000;
constexpr std::size_t kSmall = 1'000;
constexpr std::size_t kPerPoint = 50;
constexpr double kStartTargetSeconds = 10;
constexpr std::size_t kLookups = 200;  // plug-ins looked up by UUID

bool gFailed = false;

// A figure computed from a wrong result is worse than none: say so and fail
// the run, but print what there is.
void expect(bool holds, const std::string& what) {
  if (holds) return;
  std::fprintf(stderr, "bench_registry: %s\n", what.c_str());
  gFailed = true;
}

std::size_t registeredCount(const LinuxRegistry& registry) {
  auto all = registry.allPlugIns();
  return all.ok() ? all->size() : 0;
}

// Opens `root`'s registry, timing the start-up pass; none when it fails.
std::shared_ptr<LinuxRegistry> timedOpen(const SyntheticRoot& root, double& seconds) {
  platform::Result<std::shared_ptr<LinuxRegistry>> opened = std::shared_ptr<LinuxRegistry>();
  seconds = secondsOf([&] { opened = openRegistry(root.path()); });
  if (!opened.ok()) {
    expect(false,
           "cannot open the registry of " + root.path() + ": " + opened.error().description());
    return nullptr;
  }
  const std::size_t count = registeredCount(**opened);
  expect(count == root.plugIns(), "registry of " + root.path() + " holds " + std::to_string(count) +
                                      " plug-ins, not " + std::to_string(root.plugIns()));
  return *opened;
}

// Answers the first start's seconds per plug-in.
double startUpFigures(Table& table, const SyntheticRoot& root, bool withRestart,
                      std::shared_ptr<LinuxRegistry>& kept) {
  const double n = static_cast<double>(root.plugIns());
  double first = 0;
  kept = timedOpen(root, first);
  table.add("first start, " + grouped(root.plugIns()) + " plug-ins (open + pass)",
            format("%.2f s", first),
            root.plugIns() == kLarge
                ? (first < kStartTargetSeconds ? "target < 10 s: met" : "target < 10 s: MISSED")
                : "");
  table.add("  per plug-in", micros(first / n));
  if (!withRestart || !kept) return first / n;
  kept.reset();  // closes the database file, as a daemon that exits does
  double again = 0;
  kept = timedOpen(root, again);
  table.add("restart, " + grouped(root.plugIns()) + " plug-ins already stored",
            format("%.2f s", again));
  table.add("  per plug-in", micros(again / n));
  return first / n;
}

void cacheFigures(Table& table, LinuxRegistry& registry, BenchDatabase& database) {
  // The plug-ins to look up by UUID later, one per extension point, and
  // what their records alone take. Listing them also warms SQLite's page
  // cache and the allocator, so that the growth measured next is the
  // plug-in objects; the list itself is gone before the first reading.
  std::vector<platform::Uuid> uuids;
  long recordBytes = 0;
  {
    (void)registry.allPlugIns();  // SQLite's page cache fills here, not below
    const long empty = residentBytes();
    auto records = registry.allPlugIns();
    recordBytes = residentBytes() - empty;
    expect(records.ok() && records->size() == kLarge, "cannot list the records");
    if (!records.ok() || records->size() < kLookups) return;
    for (std::size_t i = 0; i < records->size(); i += records->size() / kLookups) {
      uuids.push_back((*records)[i].uuid);
    }
  }
  const long before = residentBytes();
  std::size_t found = 0;
  const double fill = secondsOf([&] {
    auto set = database.findPlugIns(std::nullopt);
    found = set ? set->size() : 0;
  });
  const long after = residentBytes();
  const std::size_t cached = database.cacheCount();
  expect(found == kLarge && cached == kLarge, "filling the cache found " + std::to_string(found) +
                                                  " and cached " + std::to_string(cached) +
                                                  " plug-ins");
  table.add("findPlugIns all, 10,000, first (creates each)", millis(fill));
  table.add("resident memory before / after filling the cache",
            format("%.1f", before / 1048576.0) + " / " + format("%.1f MiB", after / 1048576.0));
  table.add(
      "  per cached plug-in",
      format("%.2f KiB", cached ? (after - before) / 1024.0 / static_cast<double>(cached) : 0),
      "RSS growth / cached plug-ins");
  table.add("  per registration record, for comparison",
            format("%.2f KiB", recordBytes / 1024.0 / static_cast<double>(kLarge)),
            "RSS growth while allPlugIns' list is held");

  database.syncQueue()->sync([&] { database.purgeCachesToLimit(0); });
  std::vector<double> lookups, creations, hits;
  for (const platform::Uuid& uuid : uuids) {
    lookups.push_back(secondsOf([&] { (void)registry.plugInByUuid(uuid); }));
    std::shared_ptr<qvd::QVDPlugIn> created, again;
    creations.push_back(secondsOf([&] { created = database.findPlugIn(uuid); }));
    hits.push_back(secondsOf([&] { again = database.findPlugIn(uuid); }));
    expect(created != nullptr && again == created,
           "a cached look-up did not answer the same plug-in");
  }
  const std::string of = "median of " + std::to_string(uuids.size());
  table.add("findPlugIn by UUID, first (look-up + creation)", micros(median(creations)), of);
  table.add("  the registry's plugInByUuid alone", micros(median(lookups)), of);
  table.add("findPlugIn by UUID, second (cache hit)", micros(median(hits)), of);
  table.add("  creation / hit", times(median(creations) / median(hits)));

  // Leave the cache full again for the query rounds.
  auto refilled = database.findPlugIns(std::nullopt);
  expect(refilled && refilled->size() == kLarge, "cannot refill the cache");
}

}  // namespace

int main() {
  // The daemon logs a line per plug-in created at its default level; keep
  // the run's output to the figures unless asked otherwise.
  ::setenv("QV_LOG", "error", 0);
  std::error_code error;
  char pattern[] = "qv-registry-bench-XXXXXX";
  const std::filesystem::path temp = std::filesystem::temp_directory_path(error);
  std::string parent = (temp / pattern).string();
  if (::mkdtemp(parent.data()) == nullptr) {
    std::perror("mkdtemp");
    return 1;
  }

  std::optional<SyntheticRoot> large, small;
  const double written = secondsOf([&] {
    auto madeLarge = SyntheticRoot::make(parent + "/large", kLarge, kLarge / kPerPoint);
    auto madeSmall = SyntheticRoot::make(parent + "/small", kSmall, kSmall / kPerPoint);
    if (madeLarge.ok()) large = std::move(madeLarge).value();
    if (madeSmall.ok()) small = std::move(madeSmall).value();
    if (!madeLarge.ok()) expect(false, madeLarge.error().description());
    if (!madeSmall.ok()) expect(false, madeSmall.error().description());
  });
  if (!large || !small) {
    std::filesystem::remove_all(parent, error);
    return 1;
  }
  std::printf(
      "bench_registry: %s plug-ins over %zu extension points and %s over %zu, "
      "%zu per point;\nroots written in %.1f s under %s\n",
      grouped(kLarge).c_str(), large->points(), grouped(kSmall).c_str(), small->points(), kPerPoint,
      written, parent.c_str());

  Table table;
  std::shared_ptr<LinuxRegistry> largeRegistry, smallRegistry;
  table.section("registration (LinuxRegistry::open, StartupScan::Run)");
  platform::setRootDirectoryForTesting(large->path());
  const double largeEach = startUpFigures(table, *large, true, largeRegistry);
  platform::setRootDirectoryForTesting(small->path());
  const double smallEach = startUpFigures(table, *small, false, smallRegistry);
  table.add("first start per plug-in, 10,000 / 1,000", times(largeEach / smallEach),
            "near 1 when a registration costs the same at any size");

  std::unique_ptr<BenchDatabase> largeDatabase, smallDatabase;
  if (largeRegistry && smallRegistry) {
    auto openedLarge = BenchDatabase::open(largeRegistry, large->path());
    auto openedSmall = BenchDatabase::open(smallRegistry, small->path());
    for (const auto* opened : {&openedLarge, &openedSmall}) {
      if (!opened->ok())
        expect(false, "cannot open a plug-in database: " + opened->error().description());
    }
    if (openedLarge.ok()) largeDatabase = std::move(openedLarge).value();
    if (openedSmall.ok()) smallDatabase = std::move(openedSmall).value();
  }
  if (largeDatabase && smallDatabase) {
    table.section("plug-in cache (QVDatabase, 10,000 plug-ins)");
    platform::setRootDirectoryForTesting(large->path());
    cacheFigures(table, *largeRegistry, *largeDatabase);
    platform::setRootDirectoryForTesting(small->path());
    auto warmed = smallDatabase->findPlugIns(std::nullopt);
    expect(warmed && warmed->size() == kSmall, "cannot fill the cache of 1,000");

    table.section("queries (cached plug-ins; medians of interleaved rounds)");
    QueryRounds rounds({kSmall, *smallRegistry, *smallDatabase, small->points()},
                       {kLarge, *largeRegistry, *largeDatabase, large->points()}, kPerPoint);
    for (const std::string& problem : rounds.run(table)) expect(false, problem);
  }
  table.print();

  largeDatabase.reset();
  smallDatabase.reset();
  largeRegistry.reset();
  smallRegistry.reset();
  std::filesystem::remove_all(parent, error);
  return gFailed ? 1 : 0;
}
