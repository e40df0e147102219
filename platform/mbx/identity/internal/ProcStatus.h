// The parser of /proc/<pid>/status: the confinement facts it carries.
//
// Thread safety: pure functions.
#pragma once

#include <cstddef>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::mbx::internal {

// Ordinary status files are 1-2 KiB; the CPU and node masks make them grow
// on large machines, never near this.
inline constexpr std::size_t kProcStatusLimit = 16 * 1024;

struct ProcStatusFacts {
  int seccompMode = 0;  // 0 none, 1 strict, 2 filter
  bool noNewPrivs = false;
};

// Reads the "NoNewPrivs:" (required, 0 or 1) and "Seccomp:" (0 to 2; absent
// on kernels built without seccomp, read as 0) lines. A key is recognised only
// at the start of a line, and a key given twice makes the file malformed, so
// a crafted command name on the "Name:" line cannot pass for either.
// Fails with MalformedProcFile, or TooLong past kProcStatusLimit.
Result<ProcStatusFacts> parseProcStatus(std::string_view text);

}  // namespace platform::mbx::internal
