// Containers on disk: <root>/var/containers/User/<uid>/<identifier>/. The
// user's directory and the container are made mode 0700 and, when the daemon
// runs as root, owned by the user, so that nobody else can look in. The
// shared directories above them are made 0711 when missing: every user must
// be able to pass through them, but not list whose containers exist.
// Directories that already exist are used as they are, except that a
// symbolic link or a file in place of the user's directory or the container
// is refused (NotADirectory) rather than followed.
//
// Thread safety: safe to call from any thread; concurrent calls for the same
// container all succeed with the same path.
#pragma once

#include <sys/types.h>

#include <string>

#include "platform/container/ContainerManager.h"

namespace platform::container {

class LinuxContainerManager final : public ContainerManager {
 public:
  // Containers under rootPath("var/containers/User").
  LinuxContainerManager();
  // REQUIRES: baseDirectory is absolute.
  explicit LinuxContainerManager(std::string baseDirectory);

  Result<std::string> userContainer(uid_t uid, std::string_view identifier) override;

  const std::string& baseDirectory() const { return base_; }

 private:
  const std::string base_;
};

}  // namespace platform::container
