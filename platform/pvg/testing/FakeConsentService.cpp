#include "platform/pvg/testing/FakeConsentService.h"

#include <utility>

namespace platform::pvg {

void FakeConsentService::setRecords(const std::string& bundleIdentifier,
                                    std::vector<ConsentRecord> records) {
  std::lock_guard<std::mutex> lock(mu_);
  if (records.empty()) {
    records_.erase(bundleIdentifier);
  } else {
    records_[bundleIdentifier] = std::move(records);
  }
}

void FakeConsentService::setFailure(std::optional<Error> failure) {
  std::lock_guard<std::mutex> lock(mu_);
  failure_ = std::move(failure);
}

Result<std::vector<ConsentRecord>> FakeConsentService::consentRecordsForBundle(
    const platform::bundle::Bundle& bundle) const {
  const std::optional<std::string> identifier = consentBundleIdentifier(bundle);
  std::lock_guard<std::mutex> lock(mu_);
  questions_.push_back(identifier.value_or(""));
  if (failure_) return *failure_;
  if (!identifier) {
    return Error(std::string(kConsentErrorDomain),
                 static_cast<std::int64_t>(ConsentErrorCode::NoBundleIdentifier),
                 "bundle has no bundle identifier");
  }
  auto found = records_.find(*identifier);
  if (found == records_.end()) return std::vector<ConsentRecord>();
  return found->second;
}

std::vector<std::string> FakeConsentService::questions() const {
  std::lock_guard<std::mutex> lock(mu_);
  return questions_;
}

}  // namespace platform::pvg
