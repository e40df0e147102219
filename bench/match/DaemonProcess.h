// A qvd process on a platform root, for benchmarks that measure requests end
// to end: started with QV_ROOT set, its log in a file, stopped with SIGTERM.
//
// Thread safety: one owner.
#pragma once

#include <sys/types.h>

#include <string>

#include "platform/values/Result.h"

namespace bench::match {

class DaemonProcess {
 public:
  // Starts `qvd` on `root` and waits (up to a minute: a first start
  // registers every bundle) until it accepts connections.
  static platform::Result<DaemonProcess> start(const std::string& qvd, const std::string& root);
  DaemonProcess(DaemonProcess&& other) noexcept : pid_(other.pid_) { other.pid_ = -1; }
  DaemonProcess& operator=(DaemonProcess&&) = delete;
  // Stops it (SIGTERM) and waits for it.
  ~DaemonProcess();

  pid_t pid() const { return pid_; }
  // Resident memory of the daemon, from /proc/<pid>/status; -1 if unknown.
  long residentBytes() const { return residentBytesOf(pid_); }
  // The resident set of process `pid` in bytes (VmRSS), or -1.
  static long residentBytesOf(pid_t pid);

 private:
  explicit DaemonProcess(pid_t pid) : pid_(pid) {}
  pid_t pid_ = -1;
};

}  // namespace bench::match
