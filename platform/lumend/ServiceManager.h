// The service manager (lumend): it runs plug-in processes as services for
// their hosts. The daemon tells it which host may use which plug-in
// executable (an external service), and asks it to end a plug-in's running
// instances when the plug-in is held for replacement or uninstalled.
// LinuxServiceManager keeps its records under the platform root and finds
// instances in /proc; testing/FakeServiceManager answers what a test set.
//
// Results are errno numbers, as the service manager reports them: 0 for
// success, ESRCH (3) when there was no such process.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <functional>
#include <memory>
#include <string>

#include "platform/dispatch/Queue.h"
#include "platform/values/Dictionary.h"

namespace platform::lumend {

// Receives the result of a removal: 0 when running instances were
// signalled, ESRCH when none ran, another errno when the removal failed.
using RemovalReply = std::function<void(int error)>;

class ServiceManager {
 public:
  virtual ~ServiceManager() = default;

  // Lets the process `hostPid` use the plug-in executable at
  // `executablePath` as a service, started with `overlay` laid over its
  // defaults. 0, ESRCH when the host process is gone, EINVAL when the
  // executable lies in no bundle with an identifier, or the errno of a
  // failed write.
  virtual int addExternalService(int hostPid, const std::string& executablePath,
                                 const Dictionary& overlay) = 0;

  // Ends the running instances of the plug-in bundle `bundleIdentifier`
  // (whatever their version; `version` names the one being replaced, for
  // the service manager's log) and forgets the external services recorded
  // for it. Returns at once; `reply` runs later, once, on `queue`.
  // REQUIRES: queue and reply are not null.
  virtual void removeExternalService(const std::string& bundleIdentifier,
                                     const std::string& version,
                                     std::shared_ptr<dispatch::Queue> queue,
                                     RemovalReply reply) = 0;
};

}  // namespace platform::lumend
