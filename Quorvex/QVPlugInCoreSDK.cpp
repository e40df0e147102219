// SDK resolution, canonicalisation and validation of a record's manifest.
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVPlugInCore.h"
#include "platform/holvane/ManifestMerge.h"

void QVPlugInCore::resolveSDK(const platform::holvane::SdkRegistry& registry) {
  const DictionaryRef info = bundleInfoDictionary();
  if (!info) {
    // The merge starts from the info dictionary; without one there is
    // nothing to resolve, and the caller has broken the rules.
    QVLogOps().fault("cannot resolve SDK without materialized Info.vmap");
    return;
  }
  const platform::Value sdk = sdkSpec();
  if (!sdk.isNone()) {
    const std::string* identifier = sdk.string();
    if (identifier == nullptr) {
      QVLogOps().error("invalid SDK key:%{public}@", sdk);
      return;
    }
    if (std::optional<platform::Dictionary> sdkDictionary =
            readSDKDictionary(registry, *identifier)) {
      platform::Dictionary merged = mergeDictionaryInto(*sdkDictionary, *info);
      const platform::Value displayName = merged.get(QVBundleDisplayNameKey);
      (void)setDictionaries(platform::Value(std::move(merged)));
      QVLogHV().debug("%s %@ merged with SDK", "-[QVPlugInCore resolveSDK]", displayName);
    }
  }
  canonicalize();
}

std::optional<platform::Dictionary> QVPlugInCore::readSDKDictionary(
    const platform::holvane::SdkRegistry& registry, std::string_view extensionPointIdentifier) {
  platform::Result<std::optional<platform::Dictionary>> found =
      registry.sdkDictionary(extensionPointIdentifier);
  if (!found.ok()) {
    // A registration that exists but cannot be read is not the same as none:
    // say why, then carry on as without an SDK.
    QVLogOps().error("cannot read plug-in sdk \"%{public}@\": %{public}@", extensionPointIdentifier,
                     found.error());
    return std::nullopt;
  }
  if (!*found) {
    QVLogOps().notice("plug-in sdk \"%{public}@\" not registered", extensionPointIdentifier);
  }
  return std::move(found).value();
}

bool QVPlugInCore::sdkOverridesKey(std::string_view key) {
  return platform::holvane::sdkOverridesKey(key);
}

// The registration service merges manifests by the same rules when it
// stores a record; one implementation keeps the two from drifting apart.
platform::Dictionary QVPlugInCore::mergeDictionaryInto(const platform::Dictionary& source,
                                                       const platform::Dictionary& target) {
  return platform::holvane::mergeDictionaryInto(source, target);
}

platform::Array QVPlugInCore::mergeSharedResourcesInto(const platform::Array& source,
                                                       const platform::Array& target) {
  return platform::holvane::mergeSharedResourcesInto(source, target);
}

void QVPlugInCore::canonicalize() {
  const platform::Value currentAttributes = attributes();
  platform::Dictionary attrs =
      currentAttributes.dictionary() ? *currentAttributes.dictionary() : platform::Dictionary();
  const DictionaryRef current = plugInDictionary();
  platform::Dictionary pd = current ? *current : platform::Dictionary();
  pd.set(QVExtensionAttributesKey, attrs);
  setPlugInDictionary(pd);
  if (attribute(QVExtensionVersionKey).isNone()) {
    platform::Value version = infoKey(QVBundleShortVersionStringKey);
    if (version.isNone()) version = platform::Value(QVDefaultExtensionVersion);
    attrs.set(QVExtensionVersionKey, std::move(version));
    pd.set(QVExtensionAttributesKey, std::move(attrs));
    setPlugInDictionary(std::move(pd));
  }
}

std::optional<platform::Error> QVPlugInCore::diagnose() const {
  const std::optional<std::string> id = identifier();
  if (!id || id->empty()) {
    return QVErrorWithCodeMessage(QVErrorInvalidPlugIn,
                                  "missing identifier (no XOExtensionIdentifier, nor even "
                                  "BXBundleIdentifier)");
  }
  if (protocolSpec().isNone()) {
    return QVErrorWithCodeFormat(QVErrorInvalidPlugIn, "missing \"%@\" key in Info.vmap or SDK",
                                 QVExtensionProtocolKey);
  }
  if (attributes().isNone()) {
    return QVErrorWithCodeFormat(QVErrorInvalidPlugIn, "missing \"%@\" key in Info.vmap or SDK",
                                 QVExtensionAttributesKey);
  }
  if (isAppExtension() && principalSpec() != platform::Value(QVDefaultProtocol)) {
    return QVErrorWithCodeFormat(QVErrorInvalidPlugIn,
                                 "Application Extensions may not use the \"%@\" key",
                                 QVPrincipalClassKey);
  }
  if (!pluginKey(QVPassProxyKey).isNone()) {
    return QVErrorWithCodeFormat(
        QVErrorInvalidPlugIn, "the \"%@\" key is not supported on this platform", QVPassProxyKey);
  }
  if (isHybrid()) {
    return QVErrorWithCodeMessage(QVErrorInvalidPlugIn,
                                  "hybrid plug-ins are not supported on this platform");
  }
  return std::nullopt;
}
