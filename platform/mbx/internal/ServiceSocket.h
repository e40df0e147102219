// Where services live and how their sockets are made: the name rules, the
// path under the platform root, binding (with stale-socket replacement) and
// connecting.
//
// Thread safety: free functions without shared state; call from any thread.
#pragma once

#include <sys/types.h>

#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::mbx::internal {

// Service sockets live here, relative to the platform root.
inline constexpr std::string_view kServiceDirectory = "run/quorvex/mbx";

// Refuses (BadServiceName) names that are empty, "." or contain "/", "..",
// NUL or other control bytes, since each would leave the service directory or
// make an unreadable log line.
platform::Status checkServiceName(std::string_view serviceName);

// The socket path of a service; also refuses a path that would not fit in a
// sockaddr_un.
platform::Result<std::string> servicePath(std::string_view serviceName);

struct BoundSocket {
  int fd = -1;  // listening, non-blocking, close-on-exec; owned by the caller
  dev_t device = 0;  // identify the socket file, so that it is only removed
  ino_t inode = 0;   // while it is still ours
};

// Makes the service directory (with parents), binds `path` and listens, mode
// 0666. A socket file left by a dead listener (connect() is refused) is
// replaced; a live one is not (ServiceInUse), nor is a file of another kind.
platform::Result<BoundSocket> listenAt(const std::string& path);

// Connects to `path`, waiting (marked as blocking) while the listener's
// backlog is full. Answers a non-blocking, close-on-exec socket.
// ServiceUnavailable when nobody listens there.
platform::Result<int> connectTo(const std::string& path);

// Removes `path` if it is still the socket file made by listenAt.
void removeSocketFile(const std::string& path, dev_t device, ino_t inode);

}  // namespace platform::mbx::internal
