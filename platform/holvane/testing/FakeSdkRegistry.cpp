#include "platform/holvane/testing/FakeSdkRegistry.h"

#include <utility>

namespace platform::holvane {

void FakeSdkRegistry::registerSdk(std::string extensionPointIdentifier, Dictionary sdk) {
  std::lock_guard<std::mutex> lock(mu_);
  sdks_.insert_or_assign(std::move(extensionPointIdentifier), std::move(sdk));
}

void FakeSdkRegistry::failSdk(std::string extensionPointIdentifier, Error error) {
  std::lock_guard<std::mutex> lock(mu_);
  failures_.insert_or_assign(std::move(extensionPointIdentifier), std::move(error));
}

void FakeSdkRegistry::clear() {
  std::lock_guard<std::mutex> lock(mu_);
  sdks_.clear();
  failures_.clear();
  lookups_ = 0;
}

std::size_t FakeSdkRegistry::lookupCount() const {
  std::lock_guard<std::mutex> lock(mu_);
  return lookups_;
}

Result<std::optional<Dictionary>> FakeSdkRegistry::sdkDictionary(
    std::string_view extensionPointIdentifier) const {
  std::lock_guard<std::mutex> lock(mu_);
  ++lookups_;
  if (auto failed = failures_.find(extensionPointIdentifier); failed != failures_.end()) {
    return failed->second;
  }
  auto found = sdks_.find(extensionPointIdentifier);
  if (found == sdks_.end()) return std::optional<Dictionary>();
  return std::optional<Dictionary>(found->second);
}

}  // namespace platform::holvane
