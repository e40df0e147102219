// The only place the layer creates threads. Every thread starts with all
// signals blocked, so a process-directed signal (SIGTERM, SIGINT, ...) can
// only be taken by a SignalSource's signalfd, never by a worker.
//
// Thread safety: all functions may be called from any thread.
#pragma once

#include <string>

#include "platform/dispatch/internal/Closure.h"

namespace platform::dispatch::internal {

// Starts a detached thread named `name` (at most 15 characters are kept)
// running `body`. Aborts with a message if the system refuses a thread:
// the layer cannot keep its promises without one.
void startDetachedThread(const std::string& name, Closure body);

// The calling thread's name as the kernel knows it ("qv-pool-3", "qvd", ...).
std::string currentThreadName();

// True on the process's initial thread (the one `main` runs on).
bool isProcessMainThread();

}  // namespace platform::dispatch::internal
