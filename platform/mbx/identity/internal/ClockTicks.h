// The clock that process start times are counted on.
//
// Thread safety: free functions; safe from any thread.
#pragma once

#include <cstdint>

#include "platform/values/Result.h"

namespace platform::mbx::internal {

// Now, in the units of the start time in /proc/<pid>/stat: clock ticks since
// boot (CLOCK_BOOTTIME, so time spent suspended counts), rounded down as the
// kernel rounds. A process that started before this call has a start time no
// greater than the value returned.
Result<std::uint64_t> clockTicksSinceBoot();

}  // namespace platform::mbx::internal
