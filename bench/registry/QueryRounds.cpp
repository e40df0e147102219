#include "bench/registry/QueryRounds.h"

#include <optional>

#include "bench/registry/SyntheticRoot.h"
#include "platform/holvane/RegistrationRecord.h"

namespace bench::registry {
namespace {

// Enough rounds for a stable median without stretching the run: a query of
// everything at 10,000 takes a good part of a second.
constexpr int kAllRounds = 11;
constexpr int kPointRounds = 201;
constexpr int kDigitRounds = 5;

std::optional<platform::Dictionary> pointQuery(const std::string& point) {
  return platform::Dictionary{{std::string(platform::holvane::kExtensionPointNameKey), point}};
}

std::string sized(const char* query, std::size_t plugIns) {
  return std::string(query) + ", " + grouped(plugIns);
}

}  // namespace

void QueryRounds::check(const QuerySide& side, const char* query, std::size_t found,
                        std::size_t wanted) {
  if (found == wanted) return;
  problems_.push_back(sized(query, side.plugIns) + " found " + std::to_string(found) +
                      " plug-ins, not " + std::to_string(wanted));
}

void QueryRounds::allRound(const QuerySide& side, Samples& samples) {
  std::size_t found = 0;
  samples.all.push_back(secondsOf([&] {
    auto set = side.database.findPlugIns(std::nullopt);
    found = set ? set->size() : 0;
  }));
  check(side, "findPlugIns all", found, side.plugIns);
  samples.rawAll.push_back(secondsOf([&] {
    auto records = side.registry.queryPlugIns(std::nullopt, {});
    found = records.ok() ? records->size() : 0;
  }));
  check(side, "queryPlugIns all", found, side.plugIns);
}

void QueryRounds::pointRound(const QuerySide& side, std::size_t pointIndex, Samples& samples) {
  const std::string point = SyntheticRoot::pointName(pointIndex);
  const std::optional<platform::Dictionary> query = pointQuery(point);
  std::size_t found = 0;
  samples.point.push_back(secondsOf([&] {
    auto set = side.database.findPlugIns(query);
    found = set ? set->size() : 0;
  }));
  check(side, "findPlugIns of a point", found, perPoint_);
  samples.rawPoint.push_back(secondsOf([&] {
    auto records = side.registry.queryPlugIns(point, {});
    found = records.ok() ? records->size() : 0;
  }));
  check(side, "queryPlugIns of a point", found, perPoint_);
}

std::vector<std::string> QueryRounds::run(Table& table) {
  Samples small, large, unused;
  // One untimed round each, so that no first-use cost lands in a sample.
  allRound(small_, unused);
  allRound(large_, unused);
  pointRound(small_, 0, unused);
  pointRound(large_, 0, unused);
  for (int r = 0; r < kAllRounds; ++r) {
    allRound(small_, small);
    allRound(large_, large);
  }
  // Both sizes hold the small one's points, so each round asks both the
  // same point; the rounds go through all of them.
  for (int r = 0; r < kPointRounds; ++r) {
    const std::size_t point = static_cast<std::size_t>(r) % small_.points;
    pointRound(small_, point, small);
    pointRound(large_, point, large);
  }

  auto rows = [&](const char* query, const std::vector<double>& few,
                  const std::vector<double>& many, const char* expected, int rounds) {
    const std::string of = "median of " + std::to_string(rounds);
    table.add(sized(query, small_.plugIns), millis(median(few)), of);
    table.add(sized(query, large_.plugIns), millis(median(many)), of);
    table.add("  " + grouped(large_.plugIns) + " / " + grouped(small_.plugIns),
              times(median(many) / median(few)), expected);
  };
  rows("findPlugIns all", small.all, large.all, "near 10: grows with the total", kAllRounds);
  rows("findPlugIns one point (50)", small.point, large.point, "near 1: grows with the point only",
       kPointRounds);
  rows("Registry::queryPlugIns all", small.rawAll, large.rawAll, "near 10", kAllRounds);
  rows("Registry::queryPlugIns one point (50)", small.rawPoint, large.rawPoint, "near 1",
       kPointRounds);
  table.add("  findPlugIns / queryPlugIns, one point, " + grouped(large_.plugIns),
            times(median(large.point) / median(large.rawPoint)), "the plug-in objects' share");

  // A point name with a digit is compared by numeric value, so the
  // database does not narrow by the index: every record is a candidate.
  std::vector<double> digit;
  std::size_t candidates = 0;
  const std::optional<platform::Dictionary> query = pointQuery("com.corvane.bench.point2");
  for (int r = 0; r < kDigitRounds; ++r) {
    digit.push_back(secondsOf([&] {
      auto set = large_.database.findPlugIns(query);
      candidates = set ? set->size() : 0;
    }));
  }
  table.add(sized("findPlugIns, a point named with a digit", large_.plugIns), millis(median(digit)),
            "not narrowed: " + grouped(candidates) + " candidates");
  return problems_;
}

}  // namespace bench::registry
