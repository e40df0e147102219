// The daemon's side of the load test, as the test process sees it: the
// plug-ins it writes into the root, their UUIDs as the daemon assigned
// them, the daemon's thread and descriptor figures, and its log.
#pragma once

#include <sys/resource.h>
#include <sys/types.h>

#include <gtest/gtest.h>

#include <cstdint>
#include <string>
#include <vector>

#include "tests/integration/DaemonHarness.h"
#include "tests/load/FrameClient.h"
#include "tests/load/LoadClient.h"

namespace qvd::load {

// Raises this process's descriptor limit (which the daemon inherits) to the
// hard limit; fails when that is below `atLeast`.
::testing::AssertionResult raiseDescriptorLimit(rlim_t atLeast);

// Writes `perPoint` system plug-ins on each of `points` into the root.
Catalogue writePlugIns(const integration::TemporaryRoot& root,
                       const std::vector<std::string>& points, int perPoint);
// Fills in each plug-in's UUID and form path from "find" by path.
::testing::AssertionResult resolve(FrameClient& client, Catalogue& catalogue);
// Sends one request of every kind and judges each answer.
::testing::AssertionResult answersEveryKind(FrameClient& client, const Catalogue& catalogue);

struct Figures {
  int threads = -1;
  int fds = -1;
};
// The daemon's figures once its descriptor count has held still for a
// moment: a connection just closed leaves the daemon a little later.
Figures settledFigures(pid_t daemon);

// The daemon logs everything in these tests (gigabytes under load), so its
// log is read a line at a time instead of whole.
struct LogScan {
  std::uint64_t bytes = 0;
  int faults = 0;
  int errors = 0;
  std::string firstFaultsAndErrors;  // up to three lines
};
LogScan scanLog(const std::string& path);

}  // namespace qvd::load
