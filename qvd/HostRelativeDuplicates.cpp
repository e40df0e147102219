#include "qvd/HostRelativeDuplicates.h"

#include <errno.h>

#include <map>
#include <string>

#include "Quorvex/QVLog.h"
#include "platform/mbx/identity/PeerIdentity.h"
#include "qvd/MatchResults.h"

namespace qvd {

namespace {

std::string uuidText(const QVDPlugIn& plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn.uuid();
  return uuid ? uuid->toString() : std::string("(none)");
}

}  // namespace

void removeHostRelativeDuplicates(std::vector<std::shared_ptr<QVDPlugIn>>& candidates,
                                  const std::shared_ptr<platform::mbx::Connection>& connection) {
  if (!connection) return;
  // The executable taken when the peer was identified: reading it again
  // now could name another program if the peer has exited and its pid was
  // reused.
  const platform::mbx::PeerIdentity* peer = connection->peer();
  if (peer == nullptr || peer->executablePath().empty()) {
    QVLogOps().error("Failed to determine path for pid %d, %{errno}d",
                     peer ? static_cast<int>(peer->pid()) : 0, ESRCH);
    return;
  }
  const std::string& hostPath = peer->executablePath();

  // Inside the host's own application; a later one of an identifier wins.
  std::map<std::string, std::shared_ptr<QVDPlugIn>> bundleRelative;
  for (const auto& candidate : candidates) {
    const std::optional<std::string> app = candidate->containingPath();
    if (app && hostPath.compare(0, app->size(), *app) == 0) {
      bundleRelative[candidate->identifier().value_or("")] = candidate;
    }
  }
  if (bundleRelative.empty()) return;

  std::vector<std::shared_ptr<QVDPlugIn>> kept;
  kept.reserve(candidates.size());
  for (const auto& p : candidates) {
    auto found = bundleRelative.find(p->identifier().value_or(""));
    if (found == bundleRelative.end() || found->second == p) {
      kept.push_back(p);
      continue;
    }
    const QVDPlugIn& q = *found->second;
    const std::string pPath = p->path().value_or("");
    const std::string qPath = q.path().value_or("");
    if (q.containingUrl() != p->containingUrl()) {
      QVLogOps().info("Ignoring %{public}@ @ '%{public}@' in favor of bundle-relative '%{public}@'",
                      uuidText(*p), pPath, qPath);
      continue;
    }
    const std::string pVersion = versionText(*p);
    const std::string qVersion = versionText(q);
    if (pVersion == qVersion) {
      QVLogOps().info(
          "Found two plugins with same identifier & version. Ignoring %{public}@ @ '%{public}@' in "
          "favor of first seen '%{public}@'",
          uuidText(*p), pPath, qPath);
      continue;
    }
    QVLogOps().info(
        "Found two plugins with same identifier but different versions: "
        "%{public}@(%{public}@) and %{public}@)(%{public}@)",
        p->identifier().value_or(""), pVersion, q.identifier().value_or(""), qVersion);
    kept.push_back(p);
  }
  candidates = std::move(kept);
}

}  // namespace qvd
