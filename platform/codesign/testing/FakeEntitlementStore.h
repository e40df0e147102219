// An EntitlementStore that answers what a test told it, by exact path (no
// canonicalisation, no disk): unknown executables and bundles have no
// entitlements.
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/codesign/EntitlementStore.h"

namespace platform::codesign {

class FakeEntitlementStore final : public EntitlementStore {
 public:
  void setExecutableEntitlements(std::string executablePath, Dictionary entitlements);
  void setBundleEntitlements(std::string bundlePath, Dictionary entitlements);
  // Questions about `executablePath` fail with `error` until cleared.
  void failExecutable(std::string executablePath, Error error);
  void clear();

  Result<Dictionary> entitlementsOfExecutable(std::string_view executablePath) const override;
  Result<Dictionary> entitlementsOfBundle(std::string_view bundlePath) const override;

 private:
  mutable std::mutex mu_;
  std::map<std::string, Dictionary, std::less<>> executables_;
  std::map<std::string, Dictionary, std::less<>> bundles_;
  std::map<std::string, Error, std::less<>> failures_;
};

}  // namespace platform::codesign
