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

struct QVDOptions {
  std::string serviceName;
  std::optional<std::string> databasePath;
  std::uint64_t cacheLimit = 0;
  int verboseCount = 0;
};

// The options of `arguments` (arguments[0] is the program name), or none for
// a usage error.
std::optional<QVDOptions> parseOptions(const std::vector<std::string>& arguments);

}  // namespace qvd
