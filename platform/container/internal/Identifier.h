// Which container identifiers are accepted: one path component that names
// neither the user's directory itself nor anything outside it.
//
// Thread safety: pure functions.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/container/ContainerError.h"

namespace platform::container::internal {

inline constexpr std::size_t kMaxIdentifierBytes = 255;

// None when `identifier` is accepted, else the InvalidIdentifier error.
inline std::optional<Error> refuseIdentifier(std::string_view identifier) {
  if (!identifier.empty() && identifier != "." && identifier.size() <= kMaxIdentifierBytes &&
      identifier.find('/') == std::string_view::npos &&
      identifier.find("..") == std::string_view::npos &&
      identifier.find('\0') == std::string_view::npos) {
    return std::nullopt;
  }
  return containerError(
      ContainerErrorCode::InvalidIdentifier,
      "not a container identifier: \"" + std::string(identifier.substr(0, 64)) + "\"");
}

}  // namespace platform::container::internal
