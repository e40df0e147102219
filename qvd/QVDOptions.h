// The daemon's command line: "c:d:S:v". -S names the service, -d the
// annotation file, -c the plug-in cache limit (read with atoi: text that is
// not a number gives 0), and each -v is counted (it only logs that it has no
// effect). Anything else, or an operand, is a usage error.
//
// Thread safety: pure.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <vector>

namespace qvd {

inline constexpr const char* kUsageLine = "Usage: qvd [-S servicename] [-v]";

enum class CommandLineStatus { Valid, UsageError };

struct QVDOptions {
  std::string serviceName;
  std::optional<std::string> databasePath;
  std::uint64_t cacheLimit = 0;
  // Counted up to the first usage error: each -v seen is logged even then.
  int verboseCount = 0;
  CommandLineStatus status = CommandLineStatus::Valid;
};

// The options of `arguments` (arguments[0] is the program name), read left
// to right; a later -S, -d or -c replaces an earlier one.
QVDOptions parseOptions(const std::vector<std::string>& arguments);

}  // namespace qvd
