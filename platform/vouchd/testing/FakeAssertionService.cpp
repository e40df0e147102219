#include "platform/vouchd/testing/FakeAssertionService.h"

#include <utility>

namespace platform::vouchd {

void FakeAssertionService::setInstances(const std::string& bundleIdentifier,
                                        std::vector<ExtensionInstance> instances) {
  std::lock_guard<std::mutex> lock(mu_);
  if (instances.empty()) {
    instances_.erase(bundleIdentifier);
  } else {
    instances_[bundleIdentifier] = std::move(instances);
  }
}

void FakeAssertionService::setBusy(const std::string& bundleIdentifier, int pid) {
  setInstances(bundleIdentifier,
               {ExtensionInstance{
                   pid, Dictionary{{std::string(kInstanceBundleIdentifierKey), bundleIdentifier},
                                   {std::string(kInstancePidKey), pid}}}});
}

void FakeAssertionService::setFailure(std::optional<Error> failure) {
  std::lock_guard<std::mutex> lock(mu_);
  failure_ = std::move(failure);
}

Result<std::vector<ExtensionInstance>> FakeAssertionService::busyExtensionInstances(
    const std::set<std::string>& bundleIdentifiers) const {
  std::lock_guard<std::mutex> lock(mu_);
  questions_.push_back(bundleIdentifiers);
  if (failure_) return *failure_;
  std::vector<ExtensionInstance> answer;
  for (const std::string& identifier : bundleIdentifiers) {
    auto found = instances_.find(identifier);
    if (found == instances_.end()) continue;
    answer.insert(answer.end(), found->second.begin(), found->second.end());
  }
  return answer;
}

std::vector<std::set<std::string>> FakeAssertionService::questions() const {
  std::lock_guard<std::mutex> lock(mu_);
  return questions_;
}

}  // namespace platform::vouchd
