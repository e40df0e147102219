#include "platform/container/internal/PrivateDirectory.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/container/ContainerError.h"

namespace platform::container::internal {
namespace {

// mkdir applies the umask; the mode must be exactly what was asked for.
Status makeOne(const std::string& directory, mode_t mode) {
  if (::mkdir(directory.c_str(), mode) != 0) {
    if (errno == EEXIST) return okStatus();
    return Error::posix(errno, "mkdir " + directory);
  }
  if (::chmod(directory.c_str(), mode) != 0) return Error::posix(errno, "chmod " + directory);
  return okStatus();
}

}  // namespace

Status makeSharedDirectories(const std::string& directory, mode_t mode) {
  struct stat status {};
  if (::stat(directory.c_str(), &status) == 0) {
    if (S_ISDIR(status.st_mode)) return okStatus();
    return containerError(ContainerErrorCode::NotADirectory, directory + ": not a directory");
  }
  if (errno != ENOENT) return Error::posix(errno, "stat " + directory);
  const std::size_t slash = directory.find_last_of('/');
  if (slash != 0 && slash != std::string::npos) {
    Status parent = makeSharedDirectories(directory.substr(0, slash), mode);
    if (!parent.ok()) return parent;
  }
  return makeOne(directory, mode);
}

Result<int> openPrivateDirectory(int parentFd, const std::string& name, const std::string& path,
                                 uid_t owner) {
  bool made = false;
  if (::mkdirat(parentFd, name.c_str(), 0700) == 0) {
    made = true;
  } else if (errno != EEXIST) {
    return Error::posix(errno, "mkdir " + path);
  }
  const int fd = ::openat(parentFd, name.c_str(), O_RDONLY | O_DIRECTORY | O_NOFOLLOW | O_CLOEXEC);
  if (fd < 0) {
    if (errno == ELOOP || errno == ENOTDIR) {
      return containerError(ContainerErrorCode::NotADirectory,
                            path + ": not a directory (a link or a file)");
    }
    return Error::posix(errno, "open " + path);
  }
  if (made) {
    // Through the descriptor: the directory just made, whatever happens to its name.
    Status fixed;
    if (::fchmod(fd, 0700) != 0) {
      fixed = Error::posix(errno, "chmod " + path);
    } else if (owner != static_cast<uid_t>(-1) &&
               ::fchown(fd, owner, static_cast<gid_t>(-1)) != 0) {
      fixed = Error::posix(errno, "chown " + path);
    }
    if (!fixed.ok()) {
      ::close(fd);
      return fixed.error();
    }
  }
  return fd;
}

}  // namespace platform::container::internal
