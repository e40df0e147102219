// An SdkRegistry that answers what a test registered, by exact identifier:
// unknown identifiers have no SDK dictionary. It also counts questions, so
// that a test can tell whether a lookup happened at all.
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <cstddef>
#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/holvane/SdkRegistry.h"

namespace platform::holvane {

class FakeSdkRegistry final : public SdkRegistry {
 public:
  void registerSdk(std::string extensionPointIdentifier, Dictionary sdk);
  // Questions about `extensionPointIdentifier` fail with `error` until cleared.
  void failSdk(std::string extensionPointIdentifier, Error error);
  void clear();
  std::size_t lookupCount() const;

  Result<std::optional<Dictionary>> sdkDictionary(
      std::string_view extensionPointIdentifier) const override;

 private:
  mutable std::mutex mu_;
  std::map<std::string, Dictionary, std::less<>> sdks_;
  std::map<std::string, Error, std::less<>> failures_;
  mutable std::size_t lookups_ = 0;
};

}  // namespace platform::holvane
