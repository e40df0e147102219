// The parser of /proc/<pid>/stat: the few fields identification needs.
//
// Thread safety: pure functions.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::mbx::internal {

// The kernel writes the line in one go and it is far shorter: anything
// longer is not a stat line.
inline constexpr std::size_t kProcStatLimit = 4 * 1024;

struct ProcStat {
  pid_t pid = 0;
  // The command name between the parentheses, as the process set it: it may
  // hold spaces, parentheses and newlines.
  std::string command;
  char state = '?';             // 'R', 'S', 'Z', ...
  std::uint64_t startTime = 0;  // field 22: clock ticks since boot
};

// Parses one stat line (a final newline is allowed). The command name is
// taken up to the *last* ')', since the process chooses it and may put ')'
// and spaces in it; the fields after it are split on single spaces.
// Fails with MalformedProcFile, or TooLong past kProcStatLimit.
Result<ProcStat> parseProcStat(std::string_view text);

}  // namespace platform::mbx::internal
