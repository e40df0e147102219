// Whether this machine runs the internal-diagnostics variant for a
// subsystem, which turns on extra checks and logging meant for the
// developers of that subsystem.
//
// Thread safety: safe from any thread. The answer is read from the file each
// time; callers that need a stable answer compute it once per process.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace platform::log {

// The marker file, under the platform root: <root>/etc/quorvex/internal-diagnostics.
inline constexpr std::string_view kInternalDiagnosticsPath = "etc/quorvex/internal-diagnostics";
// A marker file larger than this is not read, and enables nothing.
inline constexpr std::size_t kMaxInternalDiagnosticsBytes = 64 * 1024;

// True when the marker file exists as a regular file and either is empty
// (nothing but blank lines) or has a line that is exactly `subsystem`
// (surrounding blanks and a trailing '\r' ignored).
bool isInternalDiagnosticsVariant(std::string_view subsystem);

// The rule above applied to the contents of the marker file.
bool internalDiagnosticsListAdmits(std::string_view contents, std::string_view subsystem);

enum class InternalDiagnosticsOverride : std::uint8_t {
  None,      // read the file
  Enabled,   // answer true for every subsystem
  Disabled,  // answer false for every subsystem
};

void setInternalDiagnosticsOverrideForTesting(InternalDiagnosticsOverride value);

}  // namespace platform::log
