// Construction of the plug-in record from its parts.
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVPlugInCore.h"

std::shared_ptr<QVPlugInCore> QVPlugInCore::init() {
  return std::make_shared<QVPlugInCore>();
}

std::shared_ptr<QVPlugInCore> QVPlugInCore::initWithName(std::optional<std::string> name,
                                                         std::optional<std::string> url,
                                                         const platform::Value& bundleInfo,
                                                         std::optional<platform::Dictionary> info,
                                                         std::optional<platform::Uuid> uuid) {
  std::shared_ptr<QVPlugInCore> record = init();
  if (!record->initFieldsWithName(std::move(name), std::move(url), bundleInfo, std::move(info),
                                  uuid)) {
    return nullptr;
  }
  return record;
}

bool QVPlugInCore::initFieldsWithName(std::optional<std::string> name,
                                      std::optional<std::string> url,
                                      const platform::Value& bundleInfo,
                                      std::optional<platform::Dictionary> info,
                                      std::optional<platform::Uuid> uuid) {
  if (!setupWithName(std::move(name), std::move(url), bundleInfo, info, uuid)) return false;
  // A plug-in dictionary taken from the info dictionary wins over `info`.
  if (!plugInDictionary()) setPlugInDictionary(std::move(info));
  return true;
}

bool QVPlugInCore::setupWithName(std::optional<std::string> name, std::optional<std::string> url,
                                 const platform::Value& bundleInfo,
                                 const std::optional<platform::Dictionary>& /*info*/,
                                 std::optional<platform::Uuid> uuid) {
  if (!url) return false;
  if (!name) {
    // Name the location as a path when it is one; otherwise show what came.
    const std::string where = QVPathFromFileURL(*url).value_or(*url);
    QVLogOps().error("missing identifier in plug-in at %@", where);
    return false;
  }
  if (!bundleInfo.isNone()) {
    const platform::Value normalized = normalizeInfoDictionary(bundleInfo);
    if (!setDictionaries(normalized)) {
      QVLogOps().notice("malformed plug-in dictionary in plug-in %@ at %@: %@", *name, *url,
                        bundleInfo);
      return false;
    }
    const platform::Dictionary* normal = normalized.dictionary();
    QVLogHV().debug("%s %@", "-[QVPlugInCore setupWithName:url:bundleInfo:info:uuid:]",
                    normal ? normal->get(QVBundleDisplayNameKey) : platform::Value());
  }
  setIdentifier(std::move(name));
  setUrl(std::move(url));
  setUuid(uuid ? *uuid : platform::Uuid::generate());
  return true;
}

bool QVPlugInCore::setDictionaries(const platform::Value& info) {
  const platform::Dictionary* dictionary = info.dictionary();
  if (dictionary == nullptr) return false;
  setBundleInfoDictionary(*dictionary);
  QVLogOps().debug("%s %@", "-[QVPlugInCore setDictionaries:]",
                   dictionary->get(QVBundleDisplayNameKey));
  const platform::Dictionary* plugIn = dictionary->get(QVExtensionInfoKey).dictionary();
  if (plugIn == nullptr) return false;
  setPlugInDictionary(*plugIn);
  if (plugIn->contains(QVMultipleKey)) {
    QVLogOps().notice("multiplexed plug-ins (%{public}@ key) obsolete and ignored", QVMultipleKey);
  }
  return true;
}

platform::Value QVPlugInCore::normalizeInfoDictionary(const platform::Value& info) {
  return info;
}
