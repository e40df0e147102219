// What the integration tests put into a temporary platform root before the
// daemon starts, and what they read back from it afterwards.
#pragma once

#include <cstdint>
#include <string>
#include <utility>

#include "platform/values/Dictionary.h"
#include "platform/values/Value.h"
#include "tests/integration/DaemonHarness.h"

namespace qvd::integration {

// A system plug-in bundle at System/Library/PlugIns/<name>.ovx with
// identifier com.example.<name> on extension point `point`, declaring
// `entitlements` (none written when empty). Returns the bundle's path.
std::string writeSystemPlugIn(const TemporaryRoot& root, const std::string& name,
                              const std::string& point = "com.example.point",
                              const platform::Dictionary& entitlements = {});

// Writes `value` as an XML vmap file at `path` (directories made).
void writeVmapFile(const std::string& path, const platform::Value& value);
// The value of the vmap file at `path`, or none when it cannot be read.
platform::Value readVmapFile(const std::string& path);

// How often `name` has been posted under the root, read through the notify
// layer; 0 before the first post.
std::uint64_t postCount(const TemporaryRoot& root, const std::string& name);
// What the daemon posts for every change of holds and annotations.
inline constexpr const char* kChange = "com.corvane.quorvex.annotation-change";

// The "errorcode" and "error" of a reply: {0, ""} for a success, {~0, "no
// reply"} when there is no dictionary.
std::pair<std::uint64_t, std::string> errorOf(const platform::Value& reply);
inline const std::pair<std::uint64_t, std::string> kSuccess{0, ""};

// Runs qvctl on the root (with --service `service` when not empty).
Finished runQvctl(const TemporaryRoot& root, std::vector<std::string> arguments,
                  const std::string& service = "");

}  // namespace qvd::integration
