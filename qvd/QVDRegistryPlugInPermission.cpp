// Whether a host may use a plug-in: the host's own restriction (a rule set
// in its entitlements) and the plug-in's demand on its hosts (an
// entitlement every host must hold). The restriction is asked first, so a
// host failing both hears about its own entitlement.
#include <string>

#include "Quorvex/QVDConstants.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDRegistryPlugIn.h"

namespace qvd {

std::optional<std::string> QVDPlugIn::allowForClient(const QVDMbxClient& client) const {
  return allowForClient(client.entitlements());
}

std::optional<std::string> QVDPlugIn::allowForClient(
    const platform::Dictionary& hostEntitlements) const {
  const platform::Value& restriction = hostEntitlements.get(QVAllowedPlugInsEntitlement);
  if (!restriction.isNone()) {
    const platform::Dictionary* rules = restriction.dictionary();
    // A restriction that cannot be read restricts to nothing rather than
    // to everything: the host asked to be limited.
    if (rules == nullptr) return std::string("invalid host restriction entitlement");
    if (!match(*rules)) {
      return std::string("the host's plug-in entitlement does not allow this plug-in");
    }
  }
  const platform::Value demanded = pluginKey(QVHostEntitlementInfoKey);
  if (!demanded.isNone()) {
    // An entitlement is named by a string; a demand of another kind names
    // none a host could hold, so no host satisfies it.
    const std::string* name = demanded.string();
    if (name == nullptr || !entitlementGranted(hostEntitlements.get(*name))) {
      return "the host does not have the \"" + (name ? *name : demanded.description()) +
             "\" entitlement";
    }
  }
  return std::nullopt;
}

}  // namespace qvd
