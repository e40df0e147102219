// Ends the process with a message when the dispatch layer detects a
// programming error it cannot recover from (a sync that would deadlock, work
// on the wrong queue, a pool that can no longer grow). These are bugs in the
// caller, not conditions to handle, so they are not reported as values.
//
// Thread safety: callable from any thread.
#pragma once

namespace platform::dispatch::internal {

// Writes "qvd dispatch: <message>" and the calling thread's name to stderr,
// then aborts.
[[noreturn]] void fatal(const char* format, ...) __attribute__((format(printf, 1, 2)));

}  // namespace platform::dispatch::internal
