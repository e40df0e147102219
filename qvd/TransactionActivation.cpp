// The activation requests: "ready" checks that the host may use each listed
// plug-in and then enables them all for it; "access" only hands out read
// tokens for the plug-ins' bundles.
#include <algorithm>
#include <string>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDProbes.h"
#include "qvd/QVDSandboxIssuing.h"
#include "qvd/QVDServer.h"
#include "qvd/Transaction.h"

namespace qvd {

namespace {

std::string uuidText(const QVDPlugIn& plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn.uuid();
  return uuid ? uuid->toString() : std::string();
}

}  // namespace

void Transaction::readyPlugIns() {
  std::optional<platform::Dictionary> environment;
  if (const platform::Dictionary* given = request_.get(QVDEnvironmentKey).dictionary()) {
    environment = *given;
  }
  // Checked before any look-up: a host without the entitlement learns
  // nothing about the plug-ins it named.
  if (environment) {
    if (!client_->hasEntitlement(QVEnvironmentProvisionEntitlement)) {
      failMessage(QVErrorDenied, "Transmission of environment variables requires the " +
                                     std::string(QVEnvironmentProvisionEntitlement) +
                                     " host entitlement");
      return;
    }
    QVLogOps().debug("pid %d provided %d environment entries", client_->pid(),
                     static_cast<int>(environment->size()));
  }

  // Every check runs before anything is enabled, so a refusal for one
  // plug-in enables none of them.
  std::vector<std::shared_ptr<const QVDPlugIn>> toEnable;
  const bool checked = processUuidList([&](const std::shared_ptr<const QVDPlugIn>& plugIn) {
    const std::string identifier = plugIn->identifier().value_or("");
    const std::string uuid = uuidText(*plugIn);
    probes::pluginReady(uuid);
    if (server()->holdOnPlugIn(*plugIn)) {
      QVLogOps().notice(
          "denied access to %d for plugin %{public}@(%{public}@): the plug-in is on hold",
          client_->pid(), identifier, uuid);
      failMessage(QVErrorDenied,
                  "access to plugin " + identifier + " denied: the plug-in is on hold");
      return false;
    }
    // A data plug-in has no executable to enable; it is not an error.
    if (plugIn->isData()) return true;
    if (std::optional<std::string> reason = plugIn->allowForClient(*client_)) {
      QVLogOps().notice("denied access to %d for plugin %@(%{public}@): %{public}@", client_->pid(),
                        identifier, uuid, *reason);
      failMessage(QVErrorDenied, "access to plugin " + identifier + " denied: " + *reason);
      return false;
    }
    const bool listed = std::any_of(toEnable.begin(), toEnable.end(),
                                    [&](const auto& other) { return other == plugIn; });
    if (!listed) toEnable.push_back(plugIn);
    return true;
  });
  if (!checked) return;

  // One plug-in that cannot be enabled does not keep the host from the
  // others; the reply reports the first failure.
  std::optional<platform::Error> firstError;
  for (const std::shared_ptr<const QVDPlugIn>& plugIn : toEnable) {
    std::optional<platform::Error> error = plugIn->enableForClient(*client_, environment);
    if (error && !firstError) firstError = std::move(error);
  }
  if (firstError) {
    failError(QVErrorInvalidRequest, *firstError);
    return;
  }
  done();
}

void Transaction::accessPlugIns() {
  platform::Array tokens;
  const bool issued = processUuidList([&](const std::shared_ptr<const QVDPlugIn>& plugIn) {
    platform::Result<std::string> token =
        issueFileExtension(*server()->platform().extensions, plugIn->url().value_or(""));
    if (!token.ok()) {
      failMessage(QVErrorInvalidRequest,
                  "cannot create file extension to " + plugIn->path().value_or("") + ": " +
                      std::to_string(platform::sandbox::sandboxErrno(token.error())));
      return false;
    }
    tokens.append(std::move(token).value());
    return true;
  });
  if (!issued) return;
  reply().set(QVDExtensionsKey, std::move(tokens));
  done();
}

}  // namespace qvd
