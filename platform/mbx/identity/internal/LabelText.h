// The text of LSM labels as read from the kernel.
//
// Thread safety: pure functions.
#pragma once

#include <string>
#include <string_view>

namespace platform::mbx::internal {

// Labels come back with a trailing newline (attr/current under AppArmor) or
// NUL (SO_PEERSEC under SELinux); neither is part of the label, so the two
// sources compare equal.
inline std::string normalizeSecurityLabel(std::string_view raw) {
  while (!raw.empty() && (raw.back() == '\n' || raw.back() == '\0')) raw.remove_suffix(1);
  return std::string(raw);
}

}  // namespace platform::mbx::internal
