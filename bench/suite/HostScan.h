// What a host would do without the daemon to find the plug-ins of one
// extension point: list the plug-in directory, read every bundle's
// Info.vmap with the platform's vmap reader, and keep those whose
// XOExtension names the point. This is the least a host could do (no SDK
// merge, no entitlements, no annotations), so it flatters the scan.
//
// Thread safety: a plain function.
#pragma once

#include <cstddef>
#include <string>

#include "platform/values/Result.h"

namespace bench::suite {

// The number of bundles under `<root>/System/Library/PlugIns` whose
// Info.vmap names `point`; fails when the directory or a manifest cannot be
// read.
platform::Result<std::size_t> scanForPoint(const std::string& root, const std::string& point);

}  // namespace bench::suite
