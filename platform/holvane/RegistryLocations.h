// Where the registration service reads and writes, all under one root so
// that a test or a demo can run a whole system in a temporary directory.
//
// Thread safety: a plain value.
#pragma once

#include <string>
#include <string_view>

#include "platform/root/Root.h"

namespace platform::holvane {

struct RegistryLocations {
  std::string root;  // no trailing separator; "" stands for "/"

  // The locations under the process's platform root.
  static RegistryLocations current() {
    const std::string& r = rootDirectory();
    return RegistryLocations{r == "/" ? std::string() : r};
  }

  std::string under(std::string_view relative) const { return root + "/" + std::string(relative); }
  std::string database() const { return under("var/db/holvane/registry.sqlite"); }
  // Bundles whose path begins with this lie on the system volume.
  std::string systemVolumePrefix() const { return under("System/"); }
  std::string systemPlugIns() const { return under("System/Library/PlugIns"); }
  std::string applications() const { return under("Applications"); }
  std::string extensionPoints() const { return under("System/Library/ExtensionPoints"); }
  std::string dataContainers() const { return under("var/containers/Data"); }
};

}  // namespace platform::holvane
