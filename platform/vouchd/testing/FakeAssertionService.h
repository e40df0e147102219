// An AssertionService that answers what a test set: per bundle identifier,
// the instances to report (which may lack a bundle identifier, as a real
// service's can), or a failure for every question. It remembers the sets it
// was asked about.
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <vector>

#include "platform/vouchd/AssertionService.h"

namespace platform::vouchd {

class FakeAssertionService final : public AssertionService {
 public:
  // Reports `instances` for `bundleIdentifier` from now on (none: forget).
  void setInstances(const std::string& bundleIdentifier, std::vector<ExtensionInstance> instances);
  // A busy instance of `bundleIdentifier` with the usual properties.
  void setBusy(const std::string& bundleIdentifier, int pid);
  void setFailure(std::optional<Error> failure);

  Result<std::vector<ExtensionInstance>> busyExtensionInstances(
      const std::set<std::string>& bundleIdentifiers) const override;

  std::vector<std::set<std::string>> questions() const;

 private:
  mutable std::mutex mu_;
  std::map<std::string, std::vector<ExtensionInstance>> instances_;
  std::optional<Error> failure_;
  mutable std::vector<std::set<std::string>> questions_;
};

}  // namespace platform::vouchd
