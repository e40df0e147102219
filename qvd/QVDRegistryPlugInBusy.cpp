// Whether a plug-in is busy: a running instance of its bundle holds a busy
// assertion with the process-assertion service. An installer asks before
// taking a hold that must not interrupt work in progress.
#include <set>
#include <string>

#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "qvd/QVDRegistryPlugIn.h"

namespace qvd {

std::optional<platform::Dictionary> QVDPlugIn::checkBusy(
    const platform::vouchd::AssertionService& assertions) const {
  const platform::Value identifierValue = infoKey(QVBundleIdentifierKey);
  const std::string* bundleIdentifier = identifierValue.string();
  // A bundle without an identifier cannot have asserted anything.
  if (bundleIdentifier == nullptr) return std::nullopt;
  auto instances = assertions.busyExtensionInstances(std::set<std::string>{*bundleIdentifier});
  if (!instances.ok()) {
    QVLogOps().error("cannot ask vouchd whether %{public}@ is busy: %@", *bundleIdentifier,
                     instances.error());
    return std::nullopt;
  }
  const std::string uuidText = uuid() ? uuid()->toString() : std::string("(none)");
  for (const platform::vouchd::ExtensionInstance& instance : *instances) {
    const std::string* busy =
        instance.properties.get(platform::vouchd::kInstanceBundleIdentifierKey).string();
    if (busy != nullptr) {
      return platform::Dictionary{
          {std::string(platform::vouchd::kInstanceBundleIdentifierKey), *busy}};
    }
    QVLogOps().error("vouchd reported incomplete bundle for plug-in %@/%{public}@",
                     identifier().value_or(""), uuidText);
  }
  return std::nullopt;
}

}  // namespace qvd
