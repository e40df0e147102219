// The query figures: QVDatabase::findPlugIns and the registry's
// queryPlugIns, of every plug-in and of one extension point, on a small and
// a large registry holding the same number of plug-ins per point. Each
// round runs every query once on both sizes, so the ratios compare
// medians taken under the same load.
//
// Thread safety: one thread.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "bench/registry/BenchDatabase.h"
#include "bench/registry/Measure.h"

namespace bench::registry {

// One size: its registry and the database over it, with every plug-in
// already cached.
struct QuerySide {
  std::size_t plugIns;
  platform::holvane::LinuxRegistry& registry;
  BenchDatabase& database;
  std::size_t points;
};

class QueryRounds {
 public:
  QueryRounds(QuerySide small, QuerySide large, std::size_t perPoint)
      : small_(small), large_(large), perPoint_(perPoint) {}

  // Adds the figures to `table`; answers what went wrong (a query that
  // found the wrong number of plug-ins), empty when nothing did.
  std::vector<std::string> run(Table& table);

 private:
  struct Samples {
    std::vector<double> all, point, rawAll, rawPoint;
  };
  // Both queries of every plug-in on `side`, once.
  void allRound(const QuerySide& side, Samples& samples);
  // Both queries of extension point `pointIndex` on `side`, once.
  void pointRound(const QuerySide& side, std::size_t pointIndex, Samples& samples);
  void check(const QuerySide& side, const char* query, std::size_t found, std::size_t wanted);

  const QuerySide small_;
  const QuerySide large_;
  const std::size_t perPoint_;
  std::vector<std::string> problems_;
};

}  // namespace bench::registry
