// Errors of the bundle layer that are neither a failed system call nor a
// vmap reading fault (those keep their own domains).
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::bundle {

inline constexpr std::string_view kBundleErrorDomain = "com.corvane.platform.bundle";

// Callers and tests match on these: never renumber.
enum class BundleErrorCode : std::int64_t {
  InvalidPath = 1,         // empty, relative or longer than PATH_MAX
  InfoNotADictionary = 2,  // Info.vmap reads, but its top level is another kind
  NoBundleDirectory = 3,   // no directory to read a manifest from
};

Error bundleError(BundleErrorCode code, std::string message);

bool isBundleError(const Error& error, BundleErrorCode code);

}  // namespace platform::bundle
