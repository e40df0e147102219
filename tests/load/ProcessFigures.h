// What /proc shows of another process: whether it runs, its threads and its
// open file descriptors. The load test watches the daemon with these.
#pragma once

#include <sys/types.h>

#include <string>

namespace qvd::load {

// The child of this process running `executable` (the path exec'd), or -1.
pid_t childRunning(const std::string& executable);
// False once the process is gone or a zombie.
bool isRunning(pid_t pid);
// The "Threads:" line of /proc/<pid>/status; -1 when unreadable.
int threadCount(pid_t pid);
// Entries of /proc/<pid>/fd; -1 when unreadable.
int openFdCount(pid_t pid);

}  // namespace qvd::load
