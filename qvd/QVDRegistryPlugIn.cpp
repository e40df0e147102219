// Construction, fresh records, validation and entitlements of the
// registry-backed plug-in.
#include "qvd/QVDRegistryPlugIn.h"

#include <cmath>
#include <cstdint>
#include <limits>

#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/log/SignpostInterval.h"
#include "platform/root/Root.h"

namespace qvd {

namespace {

using platform::holvane::PlugInRecord;

std::optional<std::string> nonEmpty(const std::string& s) {
  if (s.empty()) return std::nullopt;
  return s;
}

// Whole seconds toward zero, kept inside the 32-bit range: a corrupt date
// must not make the conversion undefined.
std::int32_t secondsOf(const platform::Date& date) {
  const double seconds = std::trunc(date.secondsSince1970);
  if (!(seconds == seconds)) return 0;  // NaN
  constexpr double kMin = std::numeric_limits<std::int32_t>::min();
  constexpr double kMax = std::numeric_limits<std::int32_t>::max();
  if (seconds < kMin) return std::numeric_limits<std::int32_t>::min();
  if (seconds > kMax) return std::numeric_limits<std::int32_t>::max();
  return static_cast<std::int32_t>(seconds);
}

// The answer of a registry query, with a failed query counted as no record.
std::optional<PlugInRecord> recordOrNone(const platform::Result<std::optional<PlugInRecord>>& found,
                                         std::string_view how) {
  if (!found.ok()) {
    QVLogHV().error("registration lookup by %s failed: %{public}@", how, found.error());
    return std::nullopt;
  }
  return *found;
}

}  // namespace

std::shared_ptr<QVDPlugIn> QVDPlugIn::initWithHVData(const PlugInRecord& record,
                                                     Services services) {
  const platform::log::SignpostInterval interval(QVLogOps(), "QVHVInitialization");
  if (record.path.empty()) return nullptr;
  const std::string url = QVFileURLFromPath(record.path);
  std::shared_ptr<QVDPlugIn> plugIn(new QVDPlugIn(std::move(services)));
  std::optional<platform::Dictionary> registryPlugInDictionary;
  if (const platform::Dictionary* pd = record.plugInDictionary()) registryPlugInDictionary = *pd;
  // No info dictionary for the base record: the manifest getters read the
  // registration service's current copy instead.
  if (!plugIn->initFieldsWithName(nonEmpty(record.identifier), url, platform::Value(),
                                  std::move(registryPlugInDictionary), record.uuid)) {
    return nullptr;
  }
  plugIn->setLastModified(secondsOf(record.registered));
  plugIn->setOnSystemVolume(record.volume == platform::holvane::Volume::System);
  plugIn->setOriginalIdentifier(nonEmpty(record.originalIdentifier));
  plugIn->setEntitlements(record.entitlements);
  if (record.dataContainer) {
    plugIn->dataContainerURL_.store(QVFileURLFromPath(*record.dataContainer));
  }
  plugIn->infoVmap_.store(record.info);

  const platform::Value hub = plugIn->QVPlugInCore::pluginKey(QVHubProtocolVersionKey);
  if (std::optional<std::uint64_t> version = hub.uint64()) {
    plugIn->setHubProtocolVersion(static_cast<std::uint32_t>(*version));
  } else {
    plugIn->setHubProtocolVersion(plugIn->infoKey(QVOldStyleInfoKey).isNone() ? 2 : 1);
  }
  // The containing application's record lies at this path; its location is
  // what the plug-in records.
  if (record.containingApplicationPath) {
    plugIn->setContainingUrl(QVFileURLFromPath(*record.containingApplicationPath));
  }

  if (std::optional<platform::Error> problem = plugIn->diagnose()) {
    QVLogOps().info("ignoring mis-configured plug-in at %@: %{public}@", record.path,
                    problem->description());
    return nullptr;
  }
  return plugIn;
}

void QVDPlugIn::lendRecord(const platform::Uuid& generation,
                           const std::shared_ptr<const PlugInRecord>& record) const {
  std::lock_guard<std::mutex> hold(lentLock_);
  lentGeneration_ = generation;
  lent_ = record;
}

std::optional<PlugInRecord> QVDPlugIn::getProxy() const {
  {
    const platform::Uuid generation = services_.registry->generation();
    std::lock_guard<std::mutex> hold(lentLock_);
    if (lentGeneration_ == generation) {
      if (std::shared_ptr<const PlugInRecord> record = lent_.lock()) return *record;
    }
  }
  const std::optional<platform::Uuid> id = uuid();
  if (id) {
    if (std::optional<PlugInRecord> found =
            recordOrNone(services_.registry->plugInByUuid(*id), "uuid")) {
      return found;
    }
  }
  const std::optional<std::string> location = url();
  QVLogHV().notice("Failed to find Plugin by %{uuid_t}.16P fallback to path %@",
                   id.value_or(platform::Uuid()), location.value_or(""));
  const std::optional<std::string> p = path();
  if (!p) return std::nullopt;
  return recordOrNone(services_.registry->plugInByPath(*p), "path");
}

std::optional<platform::Error> QVDPlugIn::diagnose() const {
  if (std::optional<platform::Error> base = QVPlugInCore::diagnose()) return base;
  if (!isData() && !dataContainerURL()) {
    return QVErrorWithCodeMessage(QVErrorInvalidPlugIn,
                                  "this plug-in has no sandbox data container");
  }
  // The slash belongs to the prefix: "<root>/Systemic/x" is not on the
  // system volume.
  const std::string systemVolume = platform::rootPath("System") + "/";
  const std::optional<std::string> p = path();
  if (!containingUrl() && (!p || !p->starts_with(systemVolume))) {
    return QVErrorWithCodeMessage(QVErrorInvalidPlugIn,
                                  "plug-ins outside containing apps must be in /System");
  }
  return std::nullopt;
}

platform::Value QVDPlugIn::valueForEntitlement(std::string_view key) const {
  const DictionaryRef held = entitlements();
  return held ? held->get(key) : platform::Value();
}

bool QVDPlugIn::hasEntitlement(std::string_view key) const {
  const platform::Value value = valueForEntitlement(key);
  if (value.isNone()) return false;
  // false and 0 are the same value; any other number or kind is held.
  const std::optional<bool> truth = value.truth();
  return !truth || *truth;
}

std::string QVDPlugIn::annotationKey() const {
  const platform::Value replaced = valueForEntitlement(QVDReplacePlugInEntitlement);
  if (const std::string* key = replaced.string()) return *key;
  return identifier().value_or("");
}

}  // namespace qvd
