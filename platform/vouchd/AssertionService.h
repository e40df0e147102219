// The process-assertion service (vouchd): which running extension instances
// have declared themselves busy. A plug-in process that must not be cut
// short (it is writing a file, talking to its host) holds a busy assertion;
// an installer that wants to replace the plug-in asks here first.
// LinuxAssertionService reads the assertions from files under the platform
// root; testing/FakeAssertionService answers what a test set.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <set>
#include <string>
#include <string_view>
#include <vector>

#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"

namespace platform::vouchd {

// The property of an instance that names its bundle. It is the key bundles
// use for their identifier, so a client shown an instance recognises it.
inline constexpr std::string_view kInstanceBundleIdentifierKey = "BXBundleIdentifier";
// The property that holds the instance's process id (an integer).
inline constexpr std::string_view kInstancePidKey = "pid";

// One running instance holding a busy assertion. `properties` usually
// carries kInstanceBundleIdentifierKey; a caller must cope with an instance
// whose properties lack it.
struct ExtensionInstance {
  int pid = 0;
  Dictionary properties;
  bool operator==(const ExtensionInstance&) const = default;
};

class AssertionService {
 public:
  virtual ~AssertionService() = default;

  // The busy instances of the bundles named in `bundleIdentifiers`, grouped
  // by identifier in set order and by process id within one. Identifiers
  // that cannot name a bundle (empty, holding "/" or NUL, "." or "..", over
  // 250 bytes) have no instances. Fails only when the assertions of an
  // identifier exist but cannot be read.
  virtual Result<std::vector<ExtensionInstance>> busyExtensionInstances(
      const std::set<std::string>& bundleIdentifiers) const = 0;
};

// Whether `identifier` can name a bundle's assertion directory.
bool isAssertableBundleIdentifier(std::string_view identifier);

}  // namespace platform::vouchd
