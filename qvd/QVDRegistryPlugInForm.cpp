// What the registry-backed plug-in adds to its form (sandbox tokens), its
// Stowage action titles, and the pruned info dictionary.
#include <set>

#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVSandboxExtensionConstants.h"
#include "platform/locale/LocalizedStrings.h"
#include "qvd/QVDRegistryPlugIn.h"
#include "qvd/QVDSandboxIssuing.h"

namespace qvd {

void QVDPlugIn::augmentForm(platform::Dictionary& form) const {
  const platform::Uuid generation = services_.registry->generation();
  const std::shared_ptr<const IssuedTokens> remembered = issuedTokens_.load();
  IssuedTokens issued;
  if (remembered && remembered->generation == generation) issued = *remembered;
  issued.generation = generation;
  const bool hadWhole = issued.wholeBundle.has_value();
  const bool hadService = issued.service.has_value();

  const std::optional<std::string> location = url();
  // An application extension shares its whole bundle, whatever it lists.
  const platform::Value resources = isAppExtension() ? platform::Value(platform::Array{"."})
                                                     : pluginKey(QVSharedResourcesInfoKey);
  if (!resources.isNone() && location) {
    form.set(QVExtensionsFormKey, issueResourceExtensions(*services_.extensions, resources,
                                                          *location, &issued.wholeBundle));
  }
  if (!isData()) addServiceExtension(form, issued.service);
  if (issued.wholeBundle.has_value() != hadWhole || issued.service.has_value() != hadService) {
    issuedTokens_.store(std::move(issued));
  }
}

void QVDPlugIn::addServiceExtension(platform::Dictionary& form,
                                    std::optional<std::string>& remembered) const {
  if (remembered) {
    form.set(QVServiceExtensionFormKey, *remembered);
    return;
  }
  const platform::Value identifierValue = infoKey(QVBundleIdentifierKey);
  const std::string* serviceName = identifierValue.string();
  if (serviceName == nullptr || serviceName->empty()) {
    // Without a service name there is nothing a token could grant.
    QVLogOps().info("failed to make mach extension for %@ in plug-in at %@: %{public}s",
                    identifierValue, path().value_or(""),
                    platform::Error::posix(EINVAL).description());
    return;
  }
  // Success is logged where the token is issued.
  platform::Result<std::string> token = issueServiceExtension(*services_.extensions, *serviceName);
  if (!token.ok()) {
    QVLogOps().info(
        "failed to make mach extension for %@ in plug-in at %@: %{public}s", *serviceName,
        path().value_or(""),
        platform::Error::posix(platform::sandbox::sandboxErrno(token.error())).description());
    return;
  }
  form.set(QVServiceExtensionFormKey, *token);
  remembered = std::move(token).value();
}

platform::Dictionary QVDPlugIn::localizedStowageActionNamesForQVDict(
    const platform::holvane::PlugInRecord& record, const platform::Dictionary& qvdict) const {
  const platform::Array* actions = qvdict.get(QVExtensionStowageActionsKey).array();
  if (actions == nullptr) {
    // A value of another kind lists no actions either.
    QVLogHV().notice("no actions found in qvdict");
    return platform::Dictionary();
  }
  std::vector<std::string> names;
  std::set<std::string, std::less<>> seen;
  for (const platform::Value& action : *actions) {
    const platform::Dictionary* entry = action.dictionary();
    const std::string* name =
        entry ? entry->get(QVExtensionStowageActionNameKey).string() : nullptr;
    if (name == nullptr) {
      QVLogHV().error("missing XOExtensionStowageActionName for plugin %@", record.path);
      continue;
    }
    if (seen.insert(*name).second) names.push_back(*name);
  }
  platform::Dictionary titles;
  if (names.empty()) return titles;
  const std::string locale = services_.locale->currentLocale();
  for (const std::string& name : names) {
    std::optional<std::string> title =
        platform::locale::localizedString(record.path, QVDActionStringsTable, name, locale);
    titles.set(name, title ? std::move(*title) : name);
  }
  return titles;
}

platform::Dictionary QVDPlugIn::prunedInfoDictionaryFor(const platform::Dictionary& info) {
  platform::Dictionary pruned;
  for (const auto& [key, value] : info) {
    if (!key.starts_with("DT")) pruned.set(key, value);
  }
  return pruned;
}

}  // namespace qvd
