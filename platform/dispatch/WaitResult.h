// The answer of a wait with a time limit.
//
// Thread safety: a plain value.
#pragma once

namespace platform::dispatch {

enum class WaitResult {
  Succeeded,  // the semaphore was acquired / the group became empty
  TimedOut,   // the time limit passed first; nothing was acquired
};

}  // namespace platform::dispatch
