// One process's /proc directory, held open so that every read names the same
// process: once that process is reaped, reads through the directory fail
// instead of reaching whoever gets the pid next.
//
// Thread safety: the const reads may run on any number of threads at once.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <cstdint>
#include <string>

#include "platform/mbx/identity/internal/ProcStat.h"
#include "platform/mbx/identity/internal/ProcStatus.h"
#include "platform/mbx/identity/internal/UniqueFd.h"
#include "platform/values/Result.h"

namespace platform::mbx::internal {

// Names a file: equal keys mean the same file (while it exists).
struct FileKey {
  dev_t device = 0;
  ino_t inode = 0;
  bool operator==(const FileKey&) const = default;
};

struct ExecutableFacts {
  std::string path;       // absolute, without the kernel's " (deleted)" mark
  bool replaced = false;  // the path no longer names the running file
};

class ProcDir {
 public:
  // Opens /proc/<pid>, checking that /proc is a proc file system. ENOENT
  // (POSIX domain) when there is no such process.
  // REQUIRES: pid > 0.
  static Result<ProcDir> open(pid_t pid);

  pid_t pid() const { return pid_; }

  // Reads the file `name` in the directory whole. TooLong when it holds more
  // than `limit` bytes.
  Result<std::string> readFile(const char* name, std::size_t limit) const;

  // Fails with MalformedProcFile when the line names another pid.
  Result<ProcStat> readStat() const;
  Result<ProcStatusFacts> readStatus() const;

  // The running executable's file, through the `exe` link.
  Result<FileKey> statExecutable() const;
  // The `exe` link's text. Fails with TooLong at PATH_MAX, with
  // ExecutableNotAbsolute for anything but an absolute path.
  Result<ExecutableFacts> readExecutable(const FileKey& running) const;

  // The inode of the mount namespace (`ns/mnt`).
  Result<std::uint64_t> readMountNamespace() const;

  // The LSM label of the process (`attr/current`); empty when no LSM gives
  // one.
  Result<std::string> readSecurityLabel() const;

 private:
  ProcDir(pid_t pid, UniqueFd fd) : pid_(pid), fd_(std::move(fd)) {}

  std::string pathOf(const char* name) const;

  pid_t pid_;
  UniqueFd fd_;
};

}  // namespace platform::mbx::internal
