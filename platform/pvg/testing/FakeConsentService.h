// A ConsentService that answers what a test set: per bundle identifier, the
// records to report (none for an identifier never set), or a failure for
// every question. Like the real service it fails for a bundle whose manifest
// names no identifier. It remembers the identifiers it was asked about, in
// order ("" for a bundle without one).
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <map>
#include <mutex>
#include <optional>
#include <string>
#include <vector>

#include "platform/pvg/ConsentService.h"

namespace platform::pvg {

class FakeConsentService final : public ConsentService {
 public:
  // Reports `records` for `bundleIdentifier` from now on (none: forget).
  void setRecords(const std::string& bundleIdentifier, std::vector<ConsentRecord> records);
  void setFailure(std::optional<Error> failure);

  Result<std::vector<ConsentRecord>> consentRecordsForBundle(
      const platform::bundle::Bundle& bundle) const override;

  std::vector<std::string> questions() const;

 private:
  mutable std::mutex mu_;
  std::map<std::string, std::vector<ConsentRecord>> records_;
  std::optional<Error> failure_;
  mutable std::vector<std::string> questions_;
};

}  // namespace platform::pvg
