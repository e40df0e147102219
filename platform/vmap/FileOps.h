// The handful of file-system calls an atomic file replacement makes, behind
// an interface so that tests can make any one of them fail.
//
// Thread safety: the real implementation is stateless and may be shared by
// any number of threads; fakes document their own.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <span>
#include <string>

#include "platform/values/Result.h"

namespace platform::vmap {

// The steps, named so that a fake can be told which one to fail.
enum class FileStep {
  OpenFile,        // create the temporary file
  Write,
  Fsync,           // the temporary file's contents
  Close,           // any descriptor, the directory's too
  Rename,          // over the target
  Unlink,          // the temporary file, after a failure
  OpenDirectory,
  FsyncDirectory,  // the rename itself
};

const char* fileStepName(FileStep step);

// Whether OpenFile may reuse an existing file (it never does for temporary
// files; the enum keeps call sites readable).
enum class Exclusive { Yes, No };

class FileOps {
 public:
  virtual ~FileOps() = default;

  // Opens `path` for writing, creating it with `mode` (less the umask).
  // Returns the descriptor, which the caller owns and must close().
  virtual Result<int> openFile(const std::string& path, mode_t mode, Exclusive exclusive) = 0;
  // Writes all of `bytes`, retrying short writes and EINTR.
  virtual Status write(int fd, std::span<const std::uint8_t> bytes) = 0;
  virtual Status fsync(int fd) = 0;
  // fsync of a directory descriptor: makes a rename in it durable.
  virtual Status fsyncDirectory(int fd) = 0;
  // Closes fd whatever the result; an error means data may not have reached
  // the file.
  virtual Status close(int fd) = 0;
  virtual Status rename(const std::string& from, const std::string& to) = 0;
  virtual Status unlink(const std::string& path) = 0;
  // Returns a read-only descriptor of the directory, owned by the caller.
  virtual Result<int> openDirectory(const std::string& path) = 0;

  // The process-wide real implementation (plain POSIX calls).
  static FileOps& real();
};

}  // namespace platform::vmap
