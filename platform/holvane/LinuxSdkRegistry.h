// SDK dictionaries as registered on disk: the extension point <identifier>
// registers its SDK dictionary as <directory>/<identifier>.vmap, by default
// under <root>/System/Library/ExtensionPoints. Files are read afresh at
// every question, so installing or fixing an extension point needs no
// restart.
//
// Thread safety: immutable after construction; safe to call from any thread.
#pragma once

#include <cstddef>
#include <string>
#include <string_view>

#include "platform/holvane/SdkRegistry.h"
#include "platform/vmap/Reader.h"

namespace platform::holvane {

// Longest identifier accepted: "<identifier>.vmap" must fit in a file name.
inline constexpr std::size_t kMaxExtensionPointIdentifierBytes = 250;

// None when `identifier` can name an extension-point file, else the
// InvalidIdentifier error saying why.
std::optional<Error> checkExtensionPointIdentifier(std::string_view identifier);

class LinuxSdkRegistry final : public SdkRegistry {
 public:
  // Reads rootPath("System/Library/ExtensionPoints").
  LinuxSdkRegistry();
  // REQUIRES: directory is absolute.
  explicit LinuxSdkRegistry(std::string directory,
                            vmap::ReadLimits limits = {
                                .maxBytes = 1u << 20, .maxDepth = 32, .maxItems = 100'000});

  Result<std::optional<Dictionary>> sdkDictionary(
      std::string_view extensionPointIdentifier) const override;

  const std::string& directory() const { return directory_; }

 private:
  const std::string directory_;
  const vmap::ReadLimits limits_;
};

}  // namespace platform::holvane
