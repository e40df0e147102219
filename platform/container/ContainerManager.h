// Per-user containers: the private directory in which a plug-in keeps its
// data for one user. The daemon asks for a container when it prepares a
// plug-in's launch and hands the path on. LinuxContainerManager makes them
// on disk; testing/FakeContainerManager only names them.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::container {

class ContainerManager {
 public:
  virtual ~ContainerManager() = default;

  // The absolute path of `identifier`'s container for `uid`, made (with
  // whatever it lies in) when missing. Identifiers are one path component:
  // not empty, not ".", at most 255 bytes, without "/", ".." or NUL
  // (InvalidIdentifier otherwise, see ContainerError.h).
  virtual Result<std::string> userContainer(uid_t uid, std::string_view identifier) = 0;
};

}  // namespace platform::container
