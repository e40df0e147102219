// A Registry held in memory, for tests of code that asks the registration
// service about plug-ins. Tests put records in directly (no bundles on disk
// are read); the registry assigns nothing but generations, and calls
// observers inline on the calling thread. registerPlugIn() answers a record
// put() earlier for that path, or Refused.
//
// Thread safety: safe from any thread; calls are serialised by a mutex,
// which is not held while observers or filters run.
#pragma once

#include <cstddef>
#include <map>
#include <mutex>
#include <string>
#include <vector>

#include "platform/holvane/Registry.h"
#include "platform/holvane/testing/FakeSdkRegistry.h"

namespace platform::holvane {

class FakeRegistry final : public Registry {
 public:
  // Stores `record` under its path (replacing one there) as a change.
  void put(PlugInRecord record);
  void putApplication(ApplicationRecord record);
  // Questions fail with `error` until clearFailure().
  void failQueries(Error error);
  void clearFailure();
  // How many times a record was looked up by UUID or path.
  std::size_t lookupCount() const;
  // The SDK dictionaries sdkDictionary() answers.
  FakeSdkRegistry& sdks() { return sdks_; }

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
  // Drops nothing and registers nothing: there are no bundles to look at.
  Result<ScanSummary> scanInstalledBundles() override;
  Result<std::optional<Dictionary>> sdkDictionary(
      std::string_view extensionPointIdentifier) const override;

 private:
  std::vector<RecordObserver> observersCopy(const std::vector<RecordObserver>& list) const;

  mutable std::mutex mu_;
  std::map<std::string, PlugInRecord, std::less<>> plugIns_;  // by path
  std::map<std::string, ApplicationRecord, std::less<>> applications_;
  std::map<std::string, PlugInRecord, std::less<>> registrable_;  // put() but unregistered
  std::optional<Error> failure_;
  Uuid generation_ = Uuid::generate();
  mutable std::size_t lookups_ = 0;
  std::vector<RecordObserver> installObservers_;
  std::vector<RecordObserver> uninstallObservers_;
  FakeSdkRegistry sdks_;
};

}  // namespace platform::holvane
