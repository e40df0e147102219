#include "platform/holvane/testing/FakeRegistry.h"

#include "platform/holvane/RegistryError.h"

namespace platform::holvane {

std::vector<RecordObserver> FakeRegistry::observersCopy(
    const std::vector<RecordObserver>& list) const {
  std::lock_guard<std::mutex> lock(mu_);
  return list;
}

void FakeRegistry::put(PlugInRecord record) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    registrable_.insert_or_assign(record.path, record);
    plugIns_.insert_or_assign(record.path, record);
    generation_ = Uuid::generate();
  }
  for (const RecordObserver& observer : observersCopy(installObservers_)) observer(record);
}

void FakeRegistry::putApplication(ApplicationRecord record) {
  std::lock_guard<std::mutex> lock(mu_);
  const std::string path = record.path;
  applications_.insert_or_assign(path, std::move(record));
  generation_ = Uuid::generate();
}

void FakeRegistry::failQueries(Error error) {
  std::lock_guard<std::mutex> lock(mu_);
  failure_ = std::move(error);
}

void FakeRegistry::clearFailure() {
  std::lock_guard<std::mutex> lock(mu_);
  failure_.reset();
}

std::size_t FakeRegistry::lookupCount() const {
  std::lock_guard<std::mutex> lock(mu_);
  return lookups_;
}

Result<PlugInRecord> FakeRegistry::registerPlugIn(std::string_view bundlePath) {
  std::optional<PlugInRecord> record;
  {
    std::lock_guard<std::mutex> lock(mu_);
    auto found = registrable_.find(bundlePath);
    if (found != registrable_.end()) record = found->second;
  }
  if (!record) {
    return registryError(RegistryErrorCode::Refused,
                         "cannot register " + std::string(bundlePath) + ": no such test bundle");
  }
  put(*record);
  return *record;
}

Status FakeRegistry::unregisterPlugIn(std::string_view bundlePath) {
  std::optional<PlugInRecord> record;
  {
    std::lock_guard<std::mutex> lock(mu_);
    auto found = plugIns_.find(bundlePath);
    if (found != plugIns_.end()) record = found->second;
  }
  if (!record) {
    return registryError(RegistryErrorCode::NotFound,
                         "no plug-in registered at " + std::string(bundlePath));
  }
  for (const RecordObserver& observer : observersCopy(uninstallObservers_)) observer(*record);
  std::lock_guard<std::mutex> lock(mu_);
  plugIns_.erase(record->path);
  generation_ = Uuid::generate();
  return okStatus();
}

Result<std::optional<PlugInRecord>> FakeRegistry::plugInByUuid(const Uuid& uuid) const {
  std::lock_guard<std::mutex> lock(mu_);
  ++lookups_;
  if (failure_) return *failure_;
  for (const auto& [path, record] : plugIns_) {
    if (record.uuid == uuid) return std::optional<PlugInRecord>(record);
  }
  return std::optional<PlugInRecord>();
}

Result<std::optional<PlugInRecord>> FakeRegistry::plugInByPath(std::string_view bundlePath) const {
  std::lock_guard<std::mutex> lock(mu_);
  ++lookups_;
  if (failure_) return *failure_;
  auto found = plugIns_.find(bundlePath);
  if (found == plugIns_.end()) return std::optional<PlugInRecord>();
  return std::optional<PlugInRecord>(found->second);
}

Result<std::vector<PlugInRecord>> FakeRegistry::allPlugIns() const {
  return queryPlugIns(std::nullopt, nullptr);
}

Result<std::vector<PlugInRecord>> FakeRegistry::plugInsOfApplication(
    std::string_view applicationPath) const {
  std::lock_guard<std::mutex> lock(mu_);
  if (failure_) return *failure_;
  std::vector<PlugInRecord> records;
  for (const auto& [path, record] : plugIns_) {
    if (record.containingApplicationPath == applicationPath) records.push_back(record);
  }
  return records;
}

Result<std::optional<ApplicationRecord>> FakeRegistry::applicationByPath(
    std::string_view applicationPath) const {
  std::lock_guard<std::mutex> lock(mu_);
  if (failure_) return *failure_;
  auto found = applications_.find(applicationPath);
  if (found == applications_.end()) return std::optional<ApplicationRecord>();
  return std::optional<ApplicationRecord>(found->second);
}

Result<std::vector<PlugInRecord>> FakeRegistry::queryPlugIns(
    const std::optional<std::string>& extensionPointName, const RecordFilter& filter) const {
  std::vector<PlugInRecord> candidates;
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (failure_) return *failure_;
    for (const auto& [path, record] : plugIns_) {
      if (!extensionPointName || record.extensionPointName == extensionPointName) {
        candidates.push_back(record);
      }
    }
  }
  if (!filter) return candidates;
  std::vector<PlugInRecord> kept;
  for (PlugInRecord& record : candidates) {
    if (filter(record) == FilterVerdict::Keep) kept.push_back(std::move(record));
  }
  return kept;
}

Uuid FakeRegistry::generation() const {
  std::lock_guard<std::mutex> lock(mu_);
  return generation_;
}

void FakeRegistry::addInstallObserver(RecordObserver observer) {
  std::lock_guard<std::mutex> lock(mu_);
  installObservers_.push_back(std::move(observer));
}

void FakeRegistry::addUninstallObserver(RecordObserver observer) {
  std::lock_guard<std::mutex> lock(mu_);
  uninstallObservers_.push_back(std::move(observer));
}

Result<ScanSummary> FakeRegistry::scanInstalledBundles() {
  std::lock_guard<std::mutex> lock(mu_);
  if (failure_) return *failure_;
  return ScanSummary{.unchanged = plugIns_.size()};
}

Result<std::optional<Dictionary>> FakeRegistry::sdkDictionary(
    std::string_view extensionPointIdentifier) const {
  return sdks_.sdkDictionary(extensionPointIdentifier);
}

}  // namespace platform::holvane
