// The installation requests: "add" and "remove" have the registration
// service register or deregister bundles by path; "bulk" takes no option.
#include <string>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "platform/log/LoggerRegistry.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDProbes.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"
#include "qvd/WireValues.h"

namespace qvd {

void Transaction::addPlugIns() {
  processPaths([this](const std::string& path, PathResolution resolution) {
    if (resolution == PathResolution::Unresolved) {
      failMessage(QVErrorBadPath, "invalid plugin path: " + path);
      return false;
    }
    probes::pluginAdd(path);
    if (server()->addPlugIn(QVFileURLFromPath(path))) {
      // The registration service's own reason is logged, not sent.
      QVLogOps().notice("failed to register plug-in at %@", path);
      failMessage(QVErrorRegistryFailure, "unable to register plug-in at " + path);
      return false;
    }
    return true;
  });
}

void Transaction::removePlugIns() {
  // The entitlement is asked per path, so an empty list needs none.
  processPaths([this](const std::string& path, PathResolution resolution) {
    probes::pluginRemove(path, resolution == PathResolution::Resolved);
    if (!client_->hasEntitlement(QVManagerEntitlement)) {
      platform::log::defaultLog().notice(
          "refused request from pid=%d to remove plug-in at %@ - client lacks required "
          "entitlement",
          client_->pid(), path);
      failMessage(QVErrorDenied, "caller lacks entitlement for this operation");
      return false;
    }
    // A path that no longer resolves may still name a registration: the
    // bundle can be gone before its record is.
    if (server()->removePlugIn(QVFileURLFromPath(path))) {
      failMessage(QVErrorBadPath, "no plugin at " + path);
      return false;
    }
    return true;
  });
}

void Transaction::bulkPlugIns() {
  const std::uint64_t flags = wire::uint64(request_.get(QVDFlagsKey)).value_or(0);
  QVLogOps().info("bulk options 0x%lx not supported",
                  static_cast<unsigned long>(flags & 0xffffffffu));
  done();
}

}  // namespace qvd
