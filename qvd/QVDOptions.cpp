#include "qvd/QVDOptions.h"

#include <unistd.h>

#include <cstdlib>

#include "Quorvex/QVDConstants.h"
#include "qvd/QVDatabase.h"

namespace qvd {

QVDOptions parseOptions(const std::vector<std::string>& arguments) {
  QVDOptions options;
  options.serviceName = std::string(QVDServiceName);
  options.cacheLimit = QVDatabase::kDefaultCacheLimit;

  std::vector<char*> argv;
  std::vector<std::string> copies(arguments);
  for (std::string& argument : copies) argv.push_back(argument.data());
  argv.push_back(nullptr);
  // getopt keeps its state in globals: reset it so that every parse starts
  // afresh, and keep it quiet (the caller prints the usage line).
  optind = 0;
  opterr = 0;
  const int argc = static_cast<int>(copies.size());
  int option;
  while ((option = ::getopt(argc, argv.data(), "+:c:d:S:v")) != -1) {
    switch (option) {
      case 'c': {
        // atoi, as documented: no validation. A negative limit makes no
        // sense for a cache, so it counts as 0 too.
        const int limit = std::atoi(optarg);
        options.cacheLimit = limit > 0 ? static_cast<std::uint64_t>(limit) : 0;
        break;
      }
      case 'd':
        options.databasePath = std::string(optarg);
        break;
      case 'S':
        options.serviceName = optarg;
        break;
      case 'v':
        ++options.verboseCount;
        break;
      default:
        options.status = CommandLineStatus::UsageError;
        return options;
    }
  }
  if (optind < argc) options.status = CommandLineStatus::UsageError;
  return options;
}

}  // namespace qvd
