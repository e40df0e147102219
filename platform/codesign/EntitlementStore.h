// What the daemon needs to know about entitlements: which privileges the
// program at an executable path was granted, and which a plug-in bundle
// declares for itself. The daemon is handed one store at construction and
// asks it on every privileged request; LinuxEntitlementStore reads the
// grants on disk, testing/FakeEntitlementStore answers what a test set.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <string_view>

#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::codesign {

class EntitlementStore {
 public:
  virtual ~EntitlementStore() = default;

  // The entitlements granted to the program at `executablePath`: a
  // dictionary, empty when nothing was granted. Paths are compared
  // canonically, so a symbolic link to a program finds the program's grants.
  // An error (see CodesignError.h) means the question cannot be answered
  // right now; callers must then grant nothing.
  // REQUIRES: executablePath is absolute (a relative one is an InvalidPath error).
  virtual Result<Dictionary> entitlementsOfExecutable(std::string_view executablePath) const = 0;

  // The entitlements a bundle declares in its Entitlements.vmap, empty when
  // it declares none or its file does not count. Fails when the bundle
  // directory itself cannot be found.
  // REQUIRES: bundlePath is absolute.
  virtual Result<Dictionary> entitlementsOfBundle(std::string_view bundlePath) const = 0;

  // The one entitlement `key` of the program at `executablePath`: none when
  // it was not granted and also when the entitlements could not be read, so
  // that a failure can only ever withhold a privilege.
  Value entitlementValue(std::string_view executablePath, std::string_view key) const;
};

}  // namespace platform::codesign
