#include "platform/lumend/LinuxServiceManager.h"

#include <errno.h>
#include <signal.h>
#include <sys/stat.h>

#include <utility>
#include <vector>

#include "platform/bundle/Bundle.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/lumend/internal/LumendLog.h"
#include "platform/lumend/internal/ProcessScan.h"
#include "platform/lumend/internal/ServiceRecords.h"
#include "platform/root/Root.h"

namespace platform::lumend {

using internal::lumendLog;

LinuxServiceManager::LinuxServiceManager(ServiceManagerOptions options)
    : options_(std::move(options)) {
  if (options_.recordsDirectory.empty()) options_.recordsDirectory = rootPath("run/quorvex/lumend");
}

int LinuxServiceManager::addExternalService(int hostPid, const std::string& executablePath,
                                            const Dictionary& overlay) {
  if (hostPid <= 0) return ESRCH;
  if (::kill(hostPid, 0) != 0 && errno == ESRCH) return ESRCH;
  if (executablePath.empty() || executablePath.front() != '/') return EINVAL;
  // A bundle without an executable of its own is enabled by its directory,
  // which must name that bundle, not one around it (an application's).
  struct stat status;
  const bool directory = ::stat(executablePath.c_str(), &status) == 0 && S_ISDIR(status.st_mode);
  Result<bundle::Bundle> around =
      bundle::Bundle::create(executablePath, directory ? bundle::BundlePathKind::Directory
                                                       : bundle::BundlePathKind::Executable);
  const Dictionary* info = around.ok() ? around->infoDictionary() : nullptr;
  const std::string* identifier = info ? info->get("BXBundleIdentifier").string() : nullptr;
  if (identifier == nullptr || !internal::isRecordableBundleIdentifier(*identifier)) {
    lumendLog().error("no bundle identifier around %{public}s", executablePath);
    return EINVAL;
  }
  Status written = internal::writeServiceRecord(options_.recordsDirectory, hostPid, *identifier,
                                                executablePath, overlay);
  if (!written.ok()) {
    lumendLog().error("cannot record %{public}s for %d: %@", *identifier, hostPid, written.error());
    const Error& error = written.error();
    return error.domain() == kPosixErrorDomain ? static_cast<int>(error.code()) : EIO;
  }
  return 0;
}

void LinuxServiceManager::removeExternalService(const std::string& bundleIdentifier,
                                                const std::string& version,
                                                std::shared_ptr<dispatch::Queue> queue,
                                                RemovalReply reply) {
  auto removal = dispatch::SerialQueue::create("lumend.removal");
  // The work owns a copy of the manager's options, so a manager destroyed
  // meanwhile leaves the removal whole.
  removal->async([manager = LinuxServiceManager(options_), bundleIdentifier, version,
                  queue = std::move(queue), reply = std::move(reply)]() mutable {
    lumendLog().debug("removing %{public}s (version %{public}s)", bundleIdentifier, version);
    const int error = manager.removeNow(bundleIdentifier).error;
    queue->async([reply = std::move(reply), error] { reply(error); });
  });
}

RemovalOutcome LinuxServiceManager::removeNow(const std::string& bundleIdentifier) const {
  RemovalOutcome outcome;
  if (!internal::isRecordableBundleIdentifier(bundleIdentifier)) {
    outcome.error = EINVAL;
    return outcome;
  }
  internal::ScanRequest scan{
      .procDirectory = options_.procDirectory,
      .bundleIdentifier = bundleIdentifier,
      .executables = internal::recordedExecutables(options_.recordsDirectory, bundleIdentifier,
                                                   options_.maxHostDirectories),
      .maxProcesses = options_.maxProcesses};
  std::vector<internal::ProcessHandle> instances = internal::findInstances(scan);
  std::vector<internal::ProcessHandle> signalled;
  int refusal = 0;
  for (internal::ProcessHandle& instance : instances) {
    const int sent = instance.signal(SIGTERM);
    if (sent == ESRCH) continue;  // it ended on its own meanwhile
    if (sent != 0) {
      // Still running, and out of reach: whoever waits for the removal
      // must not be told that nothing ran.
      lumendLog().error("cannot signal %d of %{public}s: %{errno}d", instance.pid(),
                        bundleIdentifier, sent);
      refusal = sent;
      continue;
    }
    lumendLog().info("sent SIGTERM to %d of %{public}s", instance.pid(), bundleIdentifier);
    signalled.push_back(std::move(instance));
  }
  outcome.signalled = signalled.size();
  if (internal::awaitExit(signalled, options_.exitGrace) > 0) {
    for (const internal::ProcessHandle& instance : signalled) {
      if (instance.exited() || instance.signal(SIGKILL) != 0) continue;
      lumendLog().error("%d of %{public}s outlived SIGTERM; sent SIGKILL", instance.pid(),
                        bundleIdentifier);
      ++outcome.killed;
    }
    outcome.survivors = internal::awaitExit(signalled, options_.killGrace);
  }
  outcome.recordsDropped = internal::dropServiceRecords(options_.recordsDirectory, bundleIdentifier,
                                                        options_.maxHostDirectories);
  outcome.error = outcome.signalled > 0 ? 0 : refusal != 0 ? refusal : ESRCH;
  return outcome;
}

}  // namespace platform::lumend
