// The privacy-consent service (pvg): which privacy-sensitive services the
// user granted to an application. The daemon asks it about the application
// that contains a plug-in, to decide how far the plug-in may reach (an
// open-access keyboard, for one, may use the network only once its
// application holds the keyboard-network consent).
// LinuxConsentService reads the consents from files under the platform
// root; testing/FakeConsentService answers what a test set.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/bundle/Bundle.h"
#include "platform/values/Result.h"

namespace platform::pvg {

// The consent that lets an open-access keyboard reach the network.
inline constexpr std::string_view kPVGServiceKeyboardNetwork = "kPVGServiceKeyboardNetwork";

// The manifest key whose string names the application asked about.
inline constexpr std::string_view kBundleIdentifierKey = "BXBundleIdentifier";

// Errors of this service's own making; reading and parsing faults keep their
// POSIX or vmap error.
inline constexpr std::string_view kConsentErrorDomain = "pvg";

// Callers and tests match on these: never renumber.
enum class ConsentErrorCode : std::int64_t {
  NoBundleIdentifier = 1,       // the manifest is missing or names no identifier
  InvalidBundleIdentifier = 2,  // the identifier cannot name a consent file
  NotAnArray = 3,               // the consent document is not a list of records
};

inline bool isConsentError(const Error& error, ConsentErrorCode code) {
  return error.is(kConsentErrorDomain, static_cast<std::int64_t>(code));
}

// One consent as stored. `granted` is absent when the record does not say;
// callers treat that as not granted.
struct ConsentRecord {
  std::string service;
  std::optional<bool> granted;
  bool operator==(const ConsentRecord&) const = default;
};

class ConsentService {
 public:
  virtual ~ConsentService() = default;

  // The consent records of the application `bundle`, in stored order; none
  // when nothing was ever recorded for it. Fails when the bundle names no
  // usable identifier or its records exist but cannot be read.
  virtual Result<std::vector<ConsentRecord>> consentRecordsForBundle(
      const platform::bundle::Bundle& bundle) const = 0;
};

// The identifier the manifest of `bundle` gives (a string under
// kBundleIdentifierKey); none when there is no manifest or no such string.
std::optional<std::string> consentBundleIdentifier(const platform::bundle::Bundle& bundle);

// Whether `identifier` can name a consent file: one path component (not
// empty, no '/' or NUL, not "." or "..") of at most 250 bytes.
bool isConsentBundleIdentifier(std::string_view identifier);

}  // namespace platform::pvg
