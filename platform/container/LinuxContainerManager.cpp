#include "platform/container/LinuxContainerManager.h"

#include <errno.h>
#include <fcntl.h>
#include <unistd.h>

#include <utility>

#include "platform/container/ContainerError.h"
#include "platform/container/internal/Identifier.h"
#include "platform/container/internal/PrivateDirectory.h"
#include "platform/root/Root.h"

namespace platform::container {
namespace {

constexpr mode_t kSharedMode = 0711;

class ScopedFd {
 public:
  explicit ScopedFd(int fd) : fd_(fd) {}
  ~ScopedFd() {
    if (fd_ >= 0) ::close(fd_);
  }
  ScopedFd(const ScopedFd&) = delete;
  ScopedFd& operator=(const ScopedFd&) = delete;
  int get() const { return fd_; }

 private:
  int fd_;
};

}  // namespace

LinuxContainerManager::LinuxContainerManager()
    : LinuxContainerManager(rootPath("var/containers/User")) {}

LinuxContainerManager::LinuxContainerManager(std::string baseDirectory)
    : base_(std::move(baseDirectory)) {}

Result<std::string> LinuxContainerManager::userContainer(uid_t uid, std::string_view identifier) {
  if (auto refused = internal::refuseIdentifier(identifier)) return *refused;
  if (Status made = internal::makeSharedDirectories(base_, kSharedMode); !made.ok()) {
    return made.error();
  }
  ScopedFd base(::open(base_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (base.get() < 0) return Error::posix(errno, "open " + base_);

  // Only root can give a directory away; otherwise it stays the daemon's.
  const uid_t owner = ::geteuid() == 0 ? uid : static_cast<uid_t>(-1);
  const std::string uidName = std::to_string(uid);
  const std::string userPath = base_ + "/" + uidName;
  Result<int> user = internal::openPrivateDirectory(base.get(), uidName, userPath, owner);
  if (!user.ok()) return user.error();
  ScopedFd userFd(*user);

  const std::string containerPath = userPath + "/" + std::string(identifier);
  Result<int> container =
      internal::openPrivateDirectory(userFd.get(), std::string(identifier), containerPath, owner);
  if (!container.ok()) return container.error();
  ::close(*container);
  return containerPath;
}

}  // namespace platform::container
