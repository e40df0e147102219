#include "platform/codesign/testing/FakeEntitlementStore.h"

#include <utility>

namespace platform::codesign {

void FakeEntitlementStore::setExecutableEntitlements(std::string executablePath,
                                                     Dictionary entitlements) {
  std::lock_guard<std::mutex> lock(mu_);
  executables_.insert_or_assign(std::move(executablePath), std::move(entitlements));
}

void FakeEntitlementStore::setBundleEntitlements(std::string bundlePath, Dictionary entitlements) {
  std::lock_guard<std::mutex> lock(mu_);
  bundles_.insert_or_assign(std::move(bundlePath), std::move(entitlements));
}

void FakeEntitlementStore::failExecutable(std::string executablePath, Error error) {
  std::lock_guard<std::mutex> lock(mu_);
  failures_.insert_or_assign(std::move(executablePath), std::move(error));
}

void FakeEntitlementStore::clear() {
  std::lock_guard<std::mutex> lock(mu_);
  executables_.clear();
  bundles_.clear();
  failures_.clear();
}

Result<Dictionary> FakeEntitlementStore::entitlementsOfExecutable(
    std::string_view executablePath) const {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto failed = failures_.find(executablePath); failed != failures_.end()) {
    return failed->second;
  }
  auto found = executables_.find(executablePath);
  return found != executables_.end() ? found->second : Dictionary();
}

Result<Dictionary> FakeEntitlementStore::entitlementsOfBundle(std::string_view bundlePath) const {
  std::lock_guard<std::mutex> lock(mu_);
  auto found = bundles_.find(bundlePath);
  return found != bundles_.end() ? found->second : Dictionary();
}

}  // namespace platform::codesign
