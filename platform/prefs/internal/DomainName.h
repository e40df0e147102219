// Which domain names may name a preferences file: one path component that
// cannot climb out of the preferences directory.
//
// Thread safety: a pure function.
#pragma once

#include <cstddef>
#include <string_view>

namespace platform::prefs::internal {

// Room for the ".vmap" suffix within the 255-byte name limit of Linux.
inline constexpr std::size_t kMaxDomainBytes = 250;

// Non-empty, at most kMaxDomainBytes, no "/", no "..", no NUL.
inline bool isValidDomainName(std::string_view domain) {
  return !domain.empty() && domain.size() <= kMaxDomainBytes &&
         domain.find('/') == std::string_view::npos &&
         domain.find("..") == std::string_view::npos && domain.find('\0') == std::string_view::npos;
}

}  // namespace platform::prefs::internal
