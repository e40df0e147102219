// Turns a bundle directory into the records the registry stores: reads and
// checks its Info.vmap, applies the identifier rule, merges the SDK
// dictionary of its extension point, notes its containing application and
// makes its data container. It does not touch the database; UUIDs and the
// original identifier are the registry's to assign.
//
// Thread safety: immutable after construction; call from any one queue at a
// time (the SDK and entitlement stores it is given must be thread-safe).
#pragma once

#include <optional>
#include <string>
#include <string_view>

#include "platform/codesign/EntitlementStore.h"
#include "platform/holvane/RegistrationRecord.h"
#include "platform/holvane/RegistryLocations.h"
#include "platform/holvane/SdkRegistry.h"

namespace platform::holvane::internal {

struct BuiltRecords {
  PlugInRecord plugIn;  // uuid and originalIdentifier not yet set
  std::optional<ApplicationRecord> application;
};

// The canonical form of `path` even when its last component no longer
// exists (its parent is resolved instead), without a trailing separator.
// None for a relative or empty path.
std::optional<std::string> canonicalBundlePath(std::string_view path);

// "file://" and `path` with the bytes a URL cannot carry percent-encoded.
std::string fileUrl(std::string_view path);

class RecordBuilder {
 public:
  // REQUIRES: `sdks` and `entitlements` outlive the builder.
  RecordBuilder(RegistryLocations locations, const SdkRegistry& sdks,
                const codesign::EntitlementStore& entitlements);

  // Refused (RegistryErrorCode::Refused) with the reason for a bundle that
  // cannot be registered; the caller logs it.
  Result<BuiltRecords> build(std::string_view bundlePath) const;

  // Makes <data containers>/<bundle identifier>/tmp (0700) when missing and
  // answers the container's path.
  Result<std::string> makeDataContainer(std::string_view bundleIdentifier) const;

 private:
  Dictionary mergedInfo(const Dictionary& info, const std::string& path) const;

  const RegistryLocations locations_;
  const SdkRegistry& sdks_;
  const codesign::EntitlementStore& entitlements_;
};

}  // namespace platform::holvane::internal
