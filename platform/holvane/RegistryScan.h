// Finds the plug-in bundles a start-up pass registers: every entry of
// <root>/System/Library/PlugIns and of <root>/Applications/*.app/PlugIns.
// Listing is cheap and bounded; reading the bundles is the registry's job.
//
// Thread safety: immutable after construction; call from any thread.
#pragma once

#include <cstddef>
#include <string>
#include <vector>

#include "platform/holvane/RegistryLocations.h"
#include "platform/values/Result.h"

namespace platform::holvane {

struct ScanLimits {
  // Per directory listed: more entries than this and the directory is
  // refused whole (TooMany), rather than registering an arbitrary part.
  std::size_t maxEntriesPerDirectory = 100'000;
  // In all: bundles beyond this are left for a later pass (and noted).
  std::size_t maxCandidates = 100'000;
  // Changes stored per transaction during a pass: enough that commits do
  // not dominate a pass over thousands of bundles, few enough that a
  // failure rolls back little.
  std::size_t changesPerTransaction = 500;
};

struct ScanCandidates {
  std::vector<std::string> plugInPaths;  // absolute, in a stable order
  std::vector<Error> problems;           // directories that could not be listed
};

class RegistryScan {
 public:
  explicit RegistryScan(RegistryLocations locations, ScanLimits limits = {});

  // A missing location is simply empty; any other listing fault is noted in
  // `problems` and the rest of the pass goes on.
  ScanCandidates candidates() const;

 private:
  // Names of the directories in `directory` (hidden entries skipped), sorted.
  Result<std::vector<std::string>> subdirectories(const std::string& directory) const;

  const RegistryLocations locations_;
  const ScanLimits limits_;
};

}  // namespace platform::holvane
