// The five caches of the registry-backed plug-in: the info dictionary and
// the localized names, kept while the registration generation stays the
// same and refetched from a current record when it changes.
//
// Where the names come from: the display name is the "InfoPlist" strings
// table's "BXBundleDisplayName" for the current locale, else the info
// dictionary's "BXBundleDisplayName", else its "BXBundleName"; the short
// name is the table's "BXBundleName", else the info dictionary's; the
// containing name is the display name, so found, of the containing
// application's bundle.
#include <mutex>

#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/locale/LocalizedStrings.h"
#include "qvd/QVDRegistryPlugIn.h"

namespace qvd {

namespace {

using platform::holvane::PlugInRecord;

std::optional<std::string> textOf(const platform::Dictionary& info, std::string_view key) {
  const std::string* text = info.get(key).string();
  if (text == nullptr) return std::nullopt;
  return *text;
}

std::optional<std::string> localizedOrInfo(std::string_view bundlePath,
                                           const platform::Dictionary& info, std::string_view key,
                                           const std::string& locale) {
  if (std::optional<std::string> localized =
          platform::locale::localizedString(bundlePath, QVDInfoStringsTable, key, locale)) {
    return localized;
  }
  return textOf(info, key);
}

std::optional<std::string> displayNameOf(std::string_view bundlePath,
                                         const platform::Dictionary& info,
                                         const std::string& locale) {
  if (std::optional<std::string> name =
          localizedOrInfo(bundlePath, info, QVBundleDisplayNameKey, locale)) {
    return name;
  }
  return localizedOrInfo(bundlePath, info, QVBundleNameKey, locale);
}

}  // namespace

bool QVDPlugIn::isFresh(const platform::Uuid& generation) const {
  const std::shared_ptr<const platform::Uuid> stamp = hvKnowledgeUUID_.load();
  return stamp && *stamp == generation;
}

void QVDPlugIn::logNoFreshProxy() const {
  QVLogOps().error("could not obtain fresh proxy for %@",
                   uuid().value_or(platform::Uuid()).toString());
}

std::string QVDPlugIn::currentLocale() const {
  return services_.locale->currentLocale();
}

QVPlugInCore::DictionaryRef QVDPlugIn::bundleInfoDictionary() const {
  const platform::Uuid generation = services_.registry->generation();
  if (isFresh(generation)) return infoVmap_.load();
  std::lock_guard<std::recursive_mutex> hold(lock_);
  if (std::optional<PlugInRecord> fresh = getProxy()) {
    infoVmap_.store(fresh->info);
  } else {
    logNoFreshProxy();
    infoVmap_.store(std::optional<platform::Dictionary>());
  }
  // Stamped even without a record: the info dictionary stays none until the
  // registration database changes again.
  hvKnowledgeUUID_.store(generation);
  return infoVmap_.load();
}

platform::Value QVDPlugIn::pluginKey(std::string_view key) const {
  const platform::Value extension = infoKey(QVExtensionInfoKey);
  const platform::Dictionary* plugIn = extension.dictionary();
  return plugIn ? plugIn->get(key) : platform::Value();
}

bool QVDPlugIn::hasLocalized(LocalizedCache which) const {
  switch (which) {
    case LocalizedCache::Name:
      return name_.load() != nullptr;
    case LocalizedCache::ShortName:
      return shortName_.load() != nullptr;
    case LocalizedCache::ContainingName:
      return containingName_.load() != nullptr;
    case LocalizedCache::StowageActionNames:
      return actionNames_.load() != nullptr;
  }
  return false;
}

std::optional<std::string> QVDPlugIn::containingNameOf(const PlugInRecord& record) const {
  if (!record.containingApplicationPath) return std::nullopt;
  const auto app = services_.registry->applicationByPath(*record.containingApplicationPath);
  if (!app.ok()) {
    QVLogHV().error("cannot read application record at %@: %{public}@",
                    *record.containingApplicationPath, app.error());
    return std::nullopt;
  }
  if (!*app) return std::nullopt;
  return displayNameOf((*app)->path, (*app)->info, currentLocale());
}

void QVDPlugIn::storeLocalizedFrom(LocalizedCache which,
                                   const std::optional<PlugInRecord>& record) const {
  // Stores are atomic; the caller holds the lock so that a fetch and its
  // stamp go together.
  switch (which) {
    case LocalizedCache::Name:
      name_.store(record ? displayNameOf(record->path, record->info, currentLocale())
                         : std::nullopt);
      return;
    case LocalizedCache::ShortName:
      shortName_.store(
          record ? localizedOrInfo(record->path, record->info, QVBundleNameKey, currentLocale())
                 : std::nullopt);
      return;
    case LocalizedCache::ContainingName:
      containingName_.store(record ? containingNameOf(*record) : std::nullopt);
      return;
    case LocalizedCache::StowageActionNames: {
      std::optional<platform::Dictionary> names;
      if (record) {
        const DictionaryRef pd = plugInDictionary();
        names = localizedStowageActionNamesForQVDict(*record, pd ? *pd : platform::Dictionary());
      }
      actionNames_.store(std::move(names));
      return;
    }
  }
}

void QVDPlugIn::refreshLocalized(LocalizedCache which) const {
  const platform::Uuid generation = services_.registry->generation();
  std::lock_guard<std::recursive_mutex> hold(lock_);
  // An empty cache is refetched whatever the stamp says, except a containing
  // name found absent because the record names no application: the same
  // generation has the same record, so a refetch could only find that again,
  // and it would cost a registry query on every form of a standalone plug-in.
  if (isFresh(generation)) {
    if (hasLocalized(which)) return;
    if (which == LocalizedCache::ContainingName && noContainerAt_ == generation) return;
  }
  std::optional<PlugInRecord> fresh = getProxy();
  if (!fresh) logNoFreshProxy();
  if (which == LocalizedCache::ContainingName) {
    noContainerAt_ = fresh && !fresh->containingApplicationPath ? generation : platform::Uuid();
  }
  storeLocalizedFrom(which, fresh);
  hvKnowledgeUUID_.store(generation);
}

std::optional<std::string> QVDPlugIn::localizedName() const {
  refreshLocalized(LocalizedCache::Name);
  return name_.copy().value_or("");
}

std::optional<std::string> QVDPlugIn::localizedShortName() const {
  refreshLocalized(LocalizedCache::ShortName);
  return shortName_.copy().value_or("");
}

std::optional<std::string> QVDPlugIn::localizedContainingName() const {
  refreshLocalized(LocalizedCache::ContainingName);
  return containingName_.copy().value_or("");
}

QVPlugInCore::DictionaryRef QVDPlugIn::localizedStowageActionNames() const {
  refreshLocalized(LocalizedCache::StowageActionNames);
  if (DictionaryRef names = actionNames_.load()) return names;
  return std::make_shared<const platform::Dictionary>();
}

}  // namespace qvd
