#include "platform/mbx/identity/internal/SocketPeer.h"

#include <sys/socket.h>

#include <cerrno>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/LabelText.h"

namespace platform::mbx::internal {

Result<PeerCredentials> peerCredentials(int socketFd) {
  struct ucred credentials {};
  socklen_t length = sizeof credentials;
  if (::getsockopt(socketFd, SOL_SOCKET, SO_PEERCRED, &credentials, &length) != 0) {
    return Error::posix(errno, "SO_PEERCRED");
  }
  if (length != sizeof credentials) return Error::posix(EPROTO, "SO_PEERCRED");
  return PeerCredentials{credentials.pid, credentials.uid, credentials.gid};
}

Result<std::string> peerSecurityLabel(int socketFd) {
  std::string label(kSecurityLabelLimit, '\0');
  socklen_t length = static_cast<socklen_t>(label.size());
  if (::getsockopt(socketFd, SOL_SOCKET, SO_PEERSEC, label.data(), &length) != 0) {
    // No LSM that labels sockets is loaded.
    if (errno == ENOPROTOOPT) return std::string();
    if (errno == ERANGE) {
      return identityError(IdentityErrorCode::TooLong, "the peer's security label is longer than " +
                                                           std::to_string(kSecurityLabelLimit) +
                                                           " bytes");
    }
    return Error::posix(errno, "SO_PEERSEC");
  }
  label.resize(length);
  return normalizeSecurityLabel(label);
}

}  // namespace platform::mbx::internal
