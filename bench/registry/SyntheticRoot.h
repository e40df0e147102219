// A platform root in a temporary directory filled with plug-in bundles as
// the registry accepts them: `plugIns` bundles on the system volume, spread
// evenly over `points` extension points, each point with its SDK file, and
// every tenth bundle with an Entitlements.vmap. Bundle i belongs to point
// i / (plugIns / points), so the first k * (plugIns / points) bundles are
// exactly those of the first k points.
//
// Point names hold letters only: the database narrows a query by the
// extension-point index only for a name without digits.
//
// Thread safety: a plain value once made.
#pragma once

#include <cstddef>
#include <string>

#include "platform/values/Result.h"

namespace bench::registry {

class SyntheticRoot {
 public:
  // Writes the root at `directory` (made, must not exist yet).
  // REQUIRES: points > 0 and plugIns is a multiple of points.
  static platform::Result<SyntheticRoot> make(std::string directory, std::size_t plugIns,
                                              std::size_t points);

  // The canonical path of the root, no trailing separator.
  const std::string& path() const { return path_; }
  std::size_t plugIns() const { return plugIns_; }
  std::size_t points() const { return points_; }
  std::size_t plugInsPerPoint() const { return plugIns_ / points_; }

  // The identifier of extension point `index` (letters and dots only).
  static std::string pointName(std::size_t index);

 private:
  SyntheticRoot(std::string path, std::size_t plugIns, std::size_t points)
      : path_(std::move(path)), plugIns_(plugIns), points_(points) {}

  std::string path_;
  std::size_t plugIns_ = 0;
  std::size_t points_ = 0;
};

}  // namespace bench::registry
