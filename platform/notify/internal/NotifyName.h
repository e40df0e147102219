// Which notification names are accepted: one path component that cannot
// climb out of the counter directory.
//
// Thread safety: a pure function.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/notify/NotifyError.h"

namespace platform::notify::internal {

inline constexpr std::size_t kMaxNameBytes = 255;

// None when `name` is accepted, else the InvalidName error.
inline std::optional<Error> refuseName(std::string_view name) {
  if (!name.empty() && name.size() <= kMaxNameBytes && name.find('/') == std::string_view::npos &&
      name.find("..") == std::string_view::npos && name.find('\0') == std::string_view::npos) {
    return std::nullopt;
  }
  return notifyError(NotifyErrorCode::InvalidName,
                     "not a notification name: \"" + std::string(name.substr(0, 64)) + "\"");
}

}  // namespace platform::notify::internal
