#include "platform/vmap/FileOps.h"

#include <fcntl.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>

namespace platform::vmap {
namespace {

// Plain POSIX calls.
// Thread safety: stateless; shared by every thread.
class RealFileOps final : public FileOps {
 public:
  Result<int> openFile(const std::string& path, mode_t mode, Exclusive exclusive) override {
    int flags = O_WRONLY | O_CREAT | O_CLOEXEC | O_NOCTTY;
    flags |= exclusive == Exclusive::Yes ? O_EXCL : O_TRUNC;
    int fd;
    do fd = ::open(path.c_str(), flags, mode);
    while (fd < 0 && errno == EINTR);
    if (fd < 0) return Error::posix(errno, "open " + path);
    return fd;
  }

  Status write(int fd, std::span<const std::uint8_t> bytes) override {
    std::size_t done = 0;
    while (done < bytes.size()) {
      const ssize_t n = ::write(fd, bytes.data() + done, bytes.size() - done);
      if (n < 0) {
        if (errno == EINTR) continue;
        return Error::posix(errno, "write");
      }
      done += static_cast<std::size_t>(n);
    }
    return okStatus();
  }

  Status fsync(int fd) override {
    if (::fsync(fd) != 0) return Error::posix(errno, "fsync");
    return okStatus();
  }

  Status fsyncDirectory(int fd) override {
    if (::fsync(fd) != 0) return Error::posix(errno, "fsync of the directory");
    return okStatus();
  }

  Status close(int fd) override {
    // On Linux the descriptor is gone even when close fails, EINTR included,
    // so it is never retried; only a real I/O error is reported.
    if (::close(fd) != 0 && errno != EINTR) return Error::posix(errno, "close");
    return okStatus();
  }

  Status rename(const std::string& from, const std::string& to) override {
    if (::rename(from.c_str(), to.c_str()) != 0)
      return Error::posix(errno, "rename " + from + " to " + to);
    return okStatus();
  }

  Status unlink(const std::string& path) override {
    if (::unlink(path.c_str()) != 0) return Error::posix(errno, "unlink " + path);
    return okStatus();
  }

  Result<int> openDirectory(const std::string& path) override {
    const int fd = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC);
    if (fd < 0) return Error::posix(errno, "open directory " + path);
    return fd;
  }
};

}  // namespace

const char* fileStepName(FileStep step) {
  switch (step) {
    case FileStep::OpenFile: return "open";
    case FileStep::Write: return "write";
    case FileStep::Fsync: return "fsync";
    case FileStep::Close: return "close";
    case FileStep::Rename: return "rename";
    case FileStep::Unlink: return "unlink";
    case FileStep::OpenDirectory: return "open directory";
    case FileStep::FsyncDirectory: return "fsync directory";
  }
  return "unknown";
}

FileOps& FileOps::real() {
  static RealFileOps ops;
  return ops;
}

}  // namespace platform::vmap
