// qvd: the plug-in registry daemon. Serves until SIGTERM.
#include <malloc.h>

#include <cstdio>
#include <string>
#include <vector>

#include "Quorvex/QVLog.h"
#include "platform/log/LoggerRegistry.h"
#include "qvd/Platform.h"
#include "qvd/QVDOptions.h"
#include "qvd/QVDServer.h"

int main(int argc, char** argv) {
  // Every match builds and frees thousands of small values. With glibc's
  // fast bins, each larger allocation afterwards first sweeps them all
  // (malloc_consolidate): a sixth of the daemon's time in a match over
  // 10,000 plug-ins. Without them freed chunks merge as they are freed.
  ::mallopt(M_MXFAST, 0);
  // A client may send bodies of up to 16 MiB. glibc raises its mmap
  // threshold each time such a block is freed, after which the next ones
  // come from the heap and stay with the process: a few clients could pin
  // 150 MiB for good. Blocks from 1 MiB up are mapped and unmapped instead.
  ::mallopt(M_MMAP_THRESHOLD, 1 << 20);
  QVLogOps().info("qvd is launching");
  const qvd::QVDOptions parsed = qvd::parseOptions(std::vector<std::string>(argv, argv + argc));
  for (int i = 0; i < parsed.verboseCount; ++i) {
    platform::log::defaultLog().error(
        "verbose option -v is ineffective; use log config --subsystem com.corvane.quorvex");
  }
  if (parsed.status == qvd::CommandLineStatus::UsageError) {
    std::fprintf(stderr, "%s\n", qvd::kUsageLine);
    return 2;
  }
  const qvd::QVDOptions* options = &parsed;
  platform::Result<qvd::Platform> services = qvd::Platform::linuxPlatform();
  std::shared_ptr<qvd::QVDServer> server;
  if (services.ok()) {
    server = qvd::QVDServer::initForService(options->serviceName, options->databasePath,
                                            std::move(services).value());
  } else {
    QVLogOps().error("the platform services are unavailable: %@", services.error());
  }
  if (!server) {
    QVLogOps().error("unable to construct server");
    return 1;
  }
  server->setCacheLimit(options->cacheLimit);
  QVLogOps().info("serving %{public}s with a plug-in cache limit of %llu", options->serviceName,
                  static_cast<unsigned long long>(server->cacheLimit()));
  server->run();
}
