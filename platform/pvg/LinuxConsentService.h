// Consents on Linux: the records of application B live in
// <root>/var/db/pvg/B.vmap, a vmap document (either form) holding an array
// of dictionaries {service: string, granted: bool}. No file means nothing
// was ever recorded for B: no records, not a failure.
//
// The files are written by an installer, so they are untrusted input: a
// file over `maxFileBytes` is refused before it is read, at most
// `maxRecords` records are kept (the rest are logged and ignored), elements
// that are not dictionaries or whose service is not a string are skipped
// (logged), and a granted that is not a boolean counts as absent.
//
// Thread safety: safe from any thread; no state changes after construction.
#pragma once

#include <cstddef>
#include <string>

#include "platform/pvg/ConsentService.h"

namespace platform::pvg {

struct ConsentLimits {
  std::size_t maxFileBytes = 1u << 20;
  std::size_t maxRecords = 4096;
};

class LinuxConsentService final : public ConsentService {
 public:
  // Consents in rootPath("var/db/pvg").
  LinuxConsentService();
  // REQUIRES: directory is absolute.
  explicit LinuxConsentService(std::string directory, ConsentLimits limits = {});

  Result<std::vector<ConsentRecord>> consentRecordsForBundle(
      const platform::bundle::Bundle& bundle) const override;

  const std::string& directory() const { return directory_; }

 private:
  const std::string directory_;
  const ConsentLimits limits_;
};

}  // namespace platform::pvg
