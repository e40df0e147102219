// Finding the running instances of a bundle: the processes whose
// executable lies in that bundle. The nearest bundle around a process's
// executable (walking up from /proc/<pid>/exe to the first directory
// holding Info.vmap) names it by BXBundleIdentifier. A process whose
// executable file is gone (its bundle was deleted under it) is still found
// when its executable is one the caller recorded for the bundle.
//
// /proc reflects every process on the system, so the scan is bounded: at
// most `maxProcesses` entries are looked at (the rest are logged and
// skipped), and each executable's bundle is read once per scan.
//
// Thread safety: a free function; safe from any thread.
#pragma once

#include <cstddef>
#include <set>
#include <string>
#include <vector>

#include "platform/lumend/internal/ProcessHandle.h"

namespace platform::lumend::internal {

struct ScanRequest {
  std::string procDirectory = "/proc";
  std::string bundleIdentifier;
  // Executables recorded for the bundle, matched as well.
  std::set<std::string> executables;
  std::size_t maxProcesses = 65536;
};

// Handles on the instances found, in /proc order. The calling process is
// never among them.
std::vector<ProcessHandle> findInstances(const ScanRequest& request);

}  // namespace platform::lumend::internal
