#include "platform/mbx/identity/IdentityError.h"

#include <utility>

namespace platform::mbx {

const char* identityErrorCodeName(IdentityErrorCode code) {
  switch (code) {
    case IdentityErrorCode::PeerExited:
      return "peer exited";
    case IdentityErrorCode::PeerNotVisible:
      return "peer not visible";
    case IdentityErrorCode::StartTimeMismatch:
      return "start time mismatch";
    case IdentityErrorCode::PidReused:
      return "pid reused";
    case IdentityErrorCode::ExecutableChanged:
      return "executable changed";
    case IdentityErrorCode::MalformedProcFile:
      return "malformed proc file";
    case IdentityErrorCode::TooLong:
      return "too long";
    case IdentityErrorCode::ExecutableNotAbsolute:
      return "executable not absolute";
    case IdentityErrorCode::ProcNotMounted:
      return "proc not mounted";
    case IdentityErrorCode::PidfdMismatch:
      return "pidfd mismatch";
  }
  return "unknown";
}

Error identityError(IdentityErrorCode code, std::string message) {
  return Error(std::string(kIdentityErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isIdentityError(const Error& error, IdentityErrorCode code) {
  return error.is(kIdentityErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::mbx
