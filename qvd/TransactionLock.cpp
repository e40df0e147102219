// The "lock" request: a privileged client (an installer about to replace
// plug-ins) takes a hold on plug-ins, or releases holds by token. Taking a
// hold may be refused while a plug-in is busy, and may first end the
// plug-ins' running processes; the reply then waits until the service
// manager has answered for every plug-in, while the hold is already in
// force.
#include <cstdint>
#include <memory>
#include <string>
#include <utility>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDPlugInHold.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"
#include "qvd/WireValues.h"

namespace qvd {

namespace {

// The bits of a hold request's "flags"; other bits are ignored.
enum QVHoldFlags : std::uint64_t {
  // "paths" name plug-in bundles; when clear they name applications, and
  // every plug-in inside each is held.
  QVHoldFlagPlugInPaths = 0x1,
  // Refuse the hold while any of the plug-ins is busy.
  QVHoldFlagRefuseBusy = 0x2,
  // End the plug-ins' running processes before the hold is granted.
  QVHoldFlagTerminate = 0x4,
};

platform::Value plugInsDescription(const std::vector<std::shared_ptr<const QVDPlugIn>>& plugIns) {
  platform::Array shown;
  for (const auto& plugIn : plugIns) {
    const std::optional<platform::Uuid> uuid = plugIn->uuid();
    shown.append(platform::Value(plugIn->identifier().value_or("") + "(" +
                                 (uuid ? uuid->toString() : std::string("none")) + ")"));
  }
  return platform::Value(std::move(shown));
}

}  // namespace

void Transaction::lockDownPlugIns() {
  // A list of tokens makes the request a release, whatever else it holds.
  if (const platform::Array* tokens = request_.get(QVDUUIDKey).array()) {
    for (const platform::Value& element : *tokens) {
      // An element that is no UUID names no hold; it is passed over.
      if (const std::optional<platform::Uuid> token = element.uuid()) server()->unholdToken(*token);
    }
    done();
    return;
  }

  const std::uint64_t flags = wire::uint64(request_.get(QVDFlagsKey)).value_or(0);
  std::vector<std::shared_ptr<const QVDPlugIn>> plugIns;
  const bool marshalled = marshalPaths([&](const std::string& path, PathResolution resolution) {
    if (resolution == PathResolution::Unresolved) {
      failMessage(QVErrorBadPath, "invalid path: " + path);
      return false;
    }
    const std::string url = QVFileURLFromPath(path);
    if (flags & QVHoldFlagPlugInPaths) {
      std::shared_ptr<const QVDPlugIn> plugIn = server()->findPlugInAtPath(url);
      if (!plugIn) {
        failMessage(QVErrorBadPath, "no plug-in at path:" + path);
        return false;
      }
      plugIns.push_back(std::move(plugIn));
    } else if (auto within = server()->plugInsWithinApplication(url)) {
      plugIns.insert(plugIns.end(), within->begin(), within->end());
    }
    return true;
  });
  if (!marshalled) return;  // marshalPaths or the callback has replied
  QVLogOps().info("processing hold request for plug-ins:%@", plugInsDescription(plugIns));

  if (flags & QVHoldFlagRefuseBusy) {
    std::vector<std::shared_ptr<const QVDPlugIn>> busy;
    platform::Array conflicts;
    for (const auto& plugIn : plugIns) {
      if (std::optional<platform::Dictionary> token =
              plugIn->checkBusy(*server()->platform().assertions)) {
        busy.push_back(plugIn);
        conflicts.append(platform::Value(std::move(*token)));
      }
    }
    if (!busy.empty()) {
      QVLogOps().debug("hold refused. Busy plug-ins:%@", plugInsDescription(busy));
      reply().set(QVDConflictsKey, std::move(conflicts));
      failMessage(QVErrorBusy, "plug-ins are busy");
      return;
    }
  }

  auto hold = QVDPlugInHold::initWithPlugInsForClient(plugIns, client_);
  const platform::Uuid token = hold->uuid();
  server()->addHold(std::move(hold));
  reply().set(QVDUUIDKey, platform::Value(token));

  if (!(flags & QVHoldFlagTerminate)) {
    QVLogOps().info("hold request granted uuid:%{public}@", token);
    done();
    return;
  }
  std::vector<platform::holvane::PlugInRecord> records;
  for (const auto& plugIn : plugIns) {
    if (auto record = plugIn->getProxy()) {
      records.push_back(std::move(*record));
    } else {
      // Gone from the registry meanwhile: its uninstall has ended its
      // processes already.
      QVLogOps().notice("no registration record to terminate plug-in %{public}@",
                        plugIn->identifier().value_or(""));
    }
  }
  server()->terminatePlugInsReply(std::move(records), [self = shared_from_this(), token] {
    QVLogOps().info("forced termination complete; hold request granted uuid:%{public}@", token);
    self->done();
  });
}

}  // namespace qvd
