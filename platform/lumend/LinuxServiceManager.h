// The service manager on Linux. External services are recorded as files,
// <root>/run/quorvex/lumend/<host pid>/<bundle identifier>.vmap holding
// {executable, overlay}; adding one for a host process that is gone answers
// ESRCH. Removing the services of a bundle identifier finds its running
// instances by scanning /proc (internal/ProcessScan.h), sends each SIGTERM,
// waits for them to end (SIGKILL for those still running after
// `exitGrace`), then drops the bundle's records. It needs no registration
// record, so it still works while a plug-in is being uninstalled.
//
// Each removal runs on a serial queue of its own ("lumend.removal"), where
// the wait for the instances to end is a marked blocking call; one stubborn
// plug-in never holds up the removal of another.
//
// Thread safety: safe from any thread; no state changes after construction.
#pragma once

#include <chrono>
#include <cstddef>
#include <string>

#include "platform/lumend/ServiceManager.h"

namespace platform::lumend {

struct ServiceManagerOptions {
  // Where external services are recorded; empty means
  // rootPath("run/quorvex/lumend").
  std::string recordsDirectory;
  std::string procDirectory = "/proc";
  // How long the instances have to end after SIGTERM, and after SIGKILL.
  std::chrono::milliseconds exitGrace{5000};
  std::chrono::milliseconds killGrace{2000};
  // Bounds on what one removal reads.
  std::size_t maxProcesses = 65536;
  std::size_t maxHostDirectories = 4096;
};

// What one removal did, for its reply and for tests.
struct RemovalOutcome {
  int error = 0;              // 0, ESRCH, or EINVAL for an unusable identifier
  std::size_t signalled = 0;  // instances sent SIGTERM
  std::size_t killed = 0;     // of those, sent SIGKILL after the grace time
  std::size_t survivors = 0;  // still running when the removal gave up
  std::size_t recordsDropped = 0;
};

class LinuxServiceManager final : public ServiceManager {
 public:
  explicit LinuxServiceManager(ServiceManagerOptions options = {});

  int addExternalService(int hostPid, const std::string& executablePath,
                         const Dictionary& overlay) override;
  void removeExternalService(const std::string& bundleIdentifier, const std::string& version,
                             std::shared_ptr<dispatch::Queue> queue, RemovalReply reply) override;

  // The removal itself, on the calling thread (it may block for the grace
  // times). removeExternalService runs this on its own queue.
  RemovalOutcome removeNow(const std::string& bundleIdentifier) const;

  const std::string& recordsDirectory() const { return options_.recordsDirectory; }

 private:
  ServiceManagerOptions options_;
};

}  // namespace platform::lumend
