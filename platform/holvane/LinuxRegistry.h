// The registration service on Linux: records in SQLite at
// <root>/var/db/holvane/registry.sqlite, all database work on one serial
// queue of its own ("com.corvane.holvane"). A damaged database file (not a
// database, failing SQLite's quick check, or of an unknown schema) is
// logged, moved aside and rebuilt by a registration pass, so a bad file
// costs a rescan, never the service. A disk that fails to read or write a
// good file is no sign of damage: the file is left as it is.
//
// Observers run on the registry's queue: install observers right after a
// change is committed, uninstall observers before the record is removed.
// They may call the registry's methods (those run inline when already on its
// queue) but should return promptly, as every other caller waits meanwhile.
//
// Thread safety: all public members are safe to call from any thread.
#pragma once

#include <functional>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/codesign/EntitlementStore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/holvane/Registry.h"
#include "platform/holvane/RegistryLocations.h"
#include "platform/holvane/RegistryScan.h"
#include "platform/holvane/internal/RecordBuilder.h"

namespace platform::holvane {

namespace internal {
class RecordStore;
}

// Whether open() registers what is installed before it returns.
enum class StartupScan { Run, Skip };

class LinuxRegistry final : public Registry {
 public:
  // Opens (creating when missing) the database under `locations`. With
  // StartupScan::Run, and always after a damaged file was replaced, it then
  // registers the installed bundles and drops records whose bundle is gone.
  // Fails when the disk fails under the file (Storage; the file is left
  // untouched for the next attempt), when no fresh database can be made, or
  // when the registration pass cannot store what it found.
  // REQUIRES: sdks and entitlements are not null.
  static Result<std::shared_ptr<LinuxRegistry>> open(
      RegistryLocations locations, std::shared_ptr<const SdkRegistry> sdks,
      std::shared_ptr<const codesign::EntitlementStore> entitlements, StartupScan scan,
      ScanLimits limits = {});
  ~LinuxRegistry() override;

  Result<PlugInRecord> registerPlugIn(std::string_view bundlePath) override;
  Status unregisterPlugIn(std::string_view bundlePath) override;
  Result<std::optional<PlugInRecord>> plugInByUuid(const Uuid& uuid) const override;
  Result<std::optional<PlugInRecord>> plugInByPath(std::string_view bundlePath) const override;
  Result<std::vector<PlugInRecord>> allPlugIns() const override;
  Result<std::vector<PlugInRecord>> plugInsOfApplication(
      std::string_view applicationPath) const override;
  Result<std::optional<ApplicationRecord>> applicationByPath(
      std::string_view applicationPath) const override;
  Result<std::vector<PlugInRecord>> queryPlugIns(const std::optional<std::string>& extensionPointName,
                                                 const RecordFilter& filter) const override;
  Uuid generation() const override;
  void addInstallObserver(RecordObserver observer) override;
  void addUninstallObserver(RecordObserver observer) override;
  Result<ScanSummary> scanInstalledBundles() override;

  Result<std::optional<Dictionary>> sdkDictionary(
      std::string_view extensionPointIdentifier) const override;

  const RegistryLocations& locations() const { return locations_; }

 private:
  enum class Outcome { Stored, Unchanged };
  struct Registered {
    PlugInRecord record;
    Outcome outcome;
  };

  LinuxRegistry(RegistryLocations locations, std::shared_ptr<const SdkRegistry> sdks,
                std::shared_ptr<const codesign::EntitlementStore> entitlements, ScanLimits limits);

  // Runs `work` on queue_: inline when already there, else by sync.
  template <typename Work>
  auto onQueue(Work&& work) const -> decltype(work());

  enum class StoreFile { Existing, Rebuilt };
  // Opens the store, replacing a damaged file with a fresh one.
  Result<StoreFile> openStore();
  // REQUIRES: on queue_.
  Result<Registered> registerOnQueue(std::string_view bundlePath);
  Status removeOnQueue(const PlugInRecord& record);
  // Runs `change` and stores a new generation in one transaction; inside a
  // batch, the batch's transaction and generation serve instead.
  Status storeChange(const std::function<Status()>& change);
  // Tells the install observers of `record`: now, or when the open batch
  // commits, so that no observer hears of a change that is not stored.
  void noteInstalled(const PlugInRecord& record);
  // A batch groups the changes of a registration pass into transactions of
  // up to ScanLimits::changesPerTransaction changes, each with one new
  // generation.
  Status beginBatch();
  Status commitBatch();
  Result<ScanSummary> scanOnQueue();

  const RegistryLocations locations_;
  const std::shared_ptr<const SdkRegistry> sdks_;
  const std::shared_ptr<const codesign::EntitlementStore> entitlements_;
  const internal::RecordBuilder builder_;
  const RegistryScan scan_;
  const std::size_t changesPerTransaction_;
  const std::shared_ptr<dispatch::SerialQueue> queue_;

  struct Batch;  // the open transaction and what it holds

  // Confined to queue_.
  std::unique_ptr<internal::RecordStore> store_;
  std::unique_ptr<Batch> batch_;
  std::vector<RecordObserver> installObservers_;
  std::vector<RecordObserver> uninstallObservers_;

  // Read by generation() without a hop to the queue; written on it.
  mutable std::mutex generationMu_;
  Uuid generation_;
};

}  // namespace platform::holvane
