// The level filter, as written in QV_LOG: a comma-separated list of entries,
// each one of
//   level                       the threshold for every logger
//   category=level              for that category in any subsystem
//   subsystem:category=level    for that one logger
// where level is debug, info, default, error, fault or off (any ASCII case).
// The most specific entry wins; among equals, the last. White space around
// entries and around '=' is ignored, as are empty entries. Without an entry
// for it, a logger uses kDefaultThreshold.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log/Level.h"

namespace platform::log {

// Thread safety: immutable once parsed; share freely across threads.
class Filter {
 public:
  static constexpr std::size_t kMaxTextBytes = 4096;
  static constexpr std::size_t kMaxEntries = 64;

  struct Parsed;

  // A filter that applies kDefaultThreshold everywhere.
  Filter() = default;

  // Malformed entries are left out and described in Parsed::problems; the
  // rest applies. Text past kMaxTextBytes and entries past kMaxEntries are
  // ignored (and reported).
  static Parsed parse(std::string_view text);

  // The threshold for the logger (subsystem, category). The default log has
  // an empty subsystem and category and only ever gets the global one.
  Threshold thresholdFor(std::string_view subsystem, std::string_view category) const;

  Threshold globalThreshold() const { return global_; }

 private:
  struct Rule {
    std::string subsystem;  // empty: any subsystem
    std::string category;
    Threshold threshold;
  };

  Threshold global_ = kDefaultThreshold;
  std::vector<Rule> rules_;
};

struct Filter::Parsed {
  Filter filter;
  // One human-readable line per ignored entry, e.g.
  // "ignoring malformed entry \"trafic=verbose\": unknown level".
  std::vector<std::string> problems;
};

}  // namespace platform::log
