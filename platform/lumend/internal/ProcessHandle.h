// A running process found by the /proc scan, held by a pidfd so that a
// signal can never reach another process that later gets the same pid.
//
// Thread safety: like any value; one handle is used by one queue at a time.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <span>
#include <string>
#include <utility>

#include "platform/values/Result.h"

namespace platform::lumend::internal {

class ProcessHandle {
 public:
  // A handle on whatever process holds `pid` now; ESRCH (POSIX domain) when
  // none does.
  static Result<ProcessHandle> open(pid_t pid);

  ProcessHandle(ProcessHandle&& other) noexcept
      : pid_(other.pid_), fd_(std::exchange(other.fd_, -1)) {}
  ProcessHandle& operator=(ProcessHandle&& other) noexcept;
  ProcessHandle(const ProcessHandle&) = delete;
  ProcessHandle& operator=(const ProcessHandle&) = delete;
  ~ProcessHandle();

  pid_t pid() const { return pid_; }
  int descriptor() const { return fd_; }
  // 0 when the signal was delivered; ESRCH once the process has gone, or
  // the errno of the refusal (EPERM without the right to signal it).
  int signal(int number) const;
  // True once the process has ended (a zombie counts as ended).
  bool exited() const;

 private:
  ProcessHandle(pid_t pid, int fd) : pid_(pid), fd_(fd) {}

  pid_t pid_;
  int fd_;
};

// Waits until every process in `handles` has ended or `limit` has passed,
// marked as a blocking call. The number still running.
std::size_t awaitExit(std::span<const ProcessHandle> handles, std::chrono::milliseconds limit);

}  // namespace platform::lumend::internal
