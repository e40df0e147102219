// What a subsystem or category name may be. The filter grammar uses ',' ':'
// and '=' as separators, and names appear verbatim in log lines, so names
// are kept to visible ASCII without those three.
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include <cstddef>
#include <optional>
#include <string_view>

#include "platform/log/LoggerError.h"

namespace platform::log::internal {

inline constexpr std::size_t kMaxNameBytes = 128;

// None when `name` is acceptable.
std::optional<LoggerError> checkName(std::string_view name);

}  // namespace platform::log::internal
