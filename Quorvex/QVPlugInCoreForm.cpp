// The plug-in form: a record written as a dictionary for clients, and read back.
#include <limits>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVPlugInCore.h"

namespace {

std::optional<std::string> stringIn(const platform::Dictionary& form, std::string_view key) {
  const std::string* s = form.get(key).string();
  return s ? std::optional<std::string>(*s) : std::nullopt;
}

std::optional<platform::Dictionary> dictionaryIn(const platform::Dictionary& form,
                                                 std::string_view key) {
  const platform::Dictionary* d = form.get(key).dictionary();
  return d ? std::optional<platform::Dictionary>(*d) : std::nullopt;
}

// A file URL for a path in a form; none when absent or not absolute (a
// relative path would be resolved against whatever directory the reader
// happens to run in).
std::optional<std::string> fileURLIn(const platform::Dictionary& form, std::string_view key) {
  std::optional<std::string> path = stringIn(form, key);
  if (!path) return std::nullopt;
  if (path->empty() || path->front() != '/') {
    QVLogOps().error("plug-in form \"%{public}@\" is not an absolute path: %@", key, *path);
    return std::nullopt;
  }
  return QVFileURLFromPath(*path);
}

std::optional<platform::Uuid> uuidIn(const platform::Dictionary& form) {
  const platform::Value& value = form.get(QVFormUUIDKey);
  if (const std::string* text = value.string()) return platform::Uuid::parse(*text);
  return value.uuid();
}

std::uint32_t hubProtocolVersionIn(const platform::Dictionary& form) {
  const std::optional<std::uint64_t> v = form.get(QVFormHubProtocolVersionKey).uint64();
  if (!v || *v > std::numeric_limits<std::uint32_t>::max()) {
    return QVFormDefaultHubProtocolVersion;
  }
  return static_cast<std::uint32_t>(*v);
}

std::int32_t lastModifiedIn(const platform::Dictionary& form) {
  const std::optional<std::int64_t> v = form.get(QVFormLastModifiedKey).int64();
  if (!v) return 0;
  // Out-of-range times are clamped rather than wrapped into another time.
  if (*v > std::numeric_limits<std::int32_t>::max())
    return std::numeric_limits<std::int32_t>::max();
  if (*v < std::numeric_limits<std::int32_t>::min())
    return std::numeric_limits<std::int32_t>::min();
  return static_cast<std::int32_t>(*v);
}

}  // namespace

std::optional<platform::Dictionary> QVPlugInCore::exportForm(
    std::optional<platform::Error>* error) const {
  const std::optional<std::string> id = identifier();
  const std::optional<std::string> location = path();
  const std::optional<platform::Uuid> identity = uuid();
  const std::optional<std::string> original = originalIdentifier();
  const DictionaryRef info = bundleInfoDictionary();
  const DictionaryRef plugIn = plugInDictionary();
  const char* missing = !id         ? "identifier"
                        : !location ? "file path"
                        : !identity ? "uuid"
                        : !original ? "original identifier"
                        : !info     ? "info dictionary"
                        : !plugIn   ? "plug-in dictionary"
                                    : nullptr;
  if (missing != nullptr) {
    if (error != nullptr) {
      *error = QVErrorWithCodeFormat(QVErrorInvalidPlugIn, "cannot export plug-in %@ at %@: no %s",
                                     id.value_or("(no identifier)"),
                                     location.value_or(url().value_or("(no location)")), missing);
    }
    return std::nullopt;
  }

  // The name is read first: it decides the display name of the bundle info,
  // which is then copied once. The other dictionaries are shared, not copied:
  // every value of the form is immutable.
  const std::optional<std::string> name = localizedName();
  platform::Dictionary bundleInfo = *info;
  bundleInfo.remove(QVBundleInfoVmapURLKey);
  if (name) {
    // Clients show the bundle's display name; give them the one for their
    // language, in the form's copy only.
    QVLogHV().debug("%s BundleInfo[BundleDisplayName] was %@", "-[QVPlugInCore export:]",
                    bundleInfo.get(QVBundleDisplayNameKey));
    bundleInfo.set(QVBundleDisplayNameKey, *name);
    QVLogHV().debug("%s BundleInfo[BundleDisplayName] is %@", "-[QVPlugInCore export:]",
                    bundleInfo.get(QVBundleDisplayNameKey));
  }
  const platform::Value currentVersion = version();

  platform::Dictionary form;
  form.reserve(17);
  form.set(QVFormHubProtocolVersionKey, hubProtocolVersion());
  form.set(QVFormPathKey, *location);
  form.set(QVFormSystemResidentKey, onSystemVolume());
  form.set(QVFormIdentifierKey, *id);
  form.set(QVFormOriginalIdentifierKey, *original);
  form.set(QVFormVersionKey,
           currentVersion.isNone() ? platform::Value(QVFormNoVersion) : currentVersion);
  form.set(QVFormBundleInfoKey, std::move(bundleInfo));
  form.set(QVFormInfoKey, platform::Value(plugIn));
  form.set(QVFormUUIDKey, identity->toString());
  form.set(QVFormLastModifiedKey, static_cast<std::int64_t>(lastModified()));
  const DictionaryRef notes = annotations();
  form.set(QVAnnotationsFormKey,
           notes ? platform::Value(notes) : platform::Value(platform::Dictionary()));

  if (const DictionaryRef granted = entitlements()) {
    form.set(QVFormEntitlementsKey, platform::Value(granted));
  }
  if (const std::optional<std::string> container = containingPath()) {
    form.set(QVFormContainingPathKey, *container);
  }
  if (const std::optional<std::string> containing = localizedContainingName()) {
    form.set(QVFormLocalizedContainingNameKey, *containing);
  }
  if (name) form.set(QVFormLocalizedNameKey, *name);
  if (const std::optional<std::string> name = localizedShortName()) {
    form.set(QVFormLocalizedShortNameKey, *name);
  }
  if (const DictionaryRef names = localizedStowageActionNames()) {
    form.set(QVFormLocalizedStowageActionNamesKey, platform::Value(names));
  }
  return form;
}

std::shared_ptr<QVPlugInCore> QVPlugInCore::initWithForm(const platform::Dictionary& form) {
  std::shared_ptr<QVPlugInCore> record = init();
  if (!record->setupWithForm(form)) return nullptr;
  return record;
}

bool QVPlugInCore::setupWithForm(const platform::Dictionary& form) {
  // "info" is not passed on: set-up takes the plug-in dictionary from the
  // info dictionary, and a form without one describes no manifest at all.
  if (!setupWithName(stringIn(form, QVFormIdentifierKey), fileURLIn(form, QVFormPathKey),
                     form.get(QVFormBundleInfoKey), std::nullopt, uuidIn(form))) {
    return false;
  }
  setHubProtocolVersion(hubProtocolVersionIn(form));
  setOriginalIdentifier(stringIn(form, QVFormOriginalIdentifierKey));
  const platform::Data* hash = form.get(QVFormHashKey).data();
  setCdhash(hash ? std::optional<platform::Data>(*hash) : std::nullopt);
  setRequirement(stringIn(form, QVFormRequirementKey));
  setLastModified(lastModifiedIn(form));
  setEntitlements(dictionaryIn(form, QVFormEntitlementsKey));
  if (std::optional<std::string> container = fileURLIn(form, QVFormContainingPathKey)) {
    setContainingUrl(std::move(container));
  }
  setOnSystemVolume(form.get(QVFormSystemResidentKey).truth().value_or(false));
  setAnnotations(dictionaryIn(form, QVAnnotationsFormKey));
  setLocalizedName(stringIn(form, QVFormLocalizedNameKey));
  setLocalizedShortName(stringIn(form, QVFormLocalizedShortNameKey));
  setLocalizedContainingName(stringIn(form, QVFormLocalizedContainingNameKey));
  setLocalizedStowageActionNames(dictionaryIn(form, QVFormLocalizedStowageActionNamesKey));
  return true;
}

void QVPlugInCore::updateFromForm(const platform::Dictionary& form) {
  setAnnotations(dictionaryIn(form, QVAnnotationsFormKey));
}
