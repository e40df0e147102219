// What SDK resolution needs of the registration service: the SDK dictionary
// that an extension point registered under its identifier. The daemon hands
// the Linux registry to whatever resolves SDKs; tests hand the fake.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <optional>
#include <string_view>

#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::holvane {

class SdkRegistry {
 public:
  virtual ~SdkRegistry() = default;

  // The SDK dictionary of the extension point `extensionPointIdentifier`:
  // none when no such extension point (or no SDK dictionary) is registered;
  // an error when one is registered but cannot be read, or the identifier
  // cannot name an extension point (see HolvaneError.h).
  virtual Result<std::optional<Dictionary>> sdkDictionary(
      std::string_view extensionPointIdentifier) const = 0;
};

}  // namespace platform::holvane
