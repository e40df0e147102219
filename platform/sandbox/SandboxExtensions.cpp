#include "platform/sandbox/SandboxExtensions.h"

#include <cerrno>

namespace platform::sandbox {

int sandboxErrno(const Error& error) {
  if (error.domain() != kPosixErrorDomain || error.code() <= 0 || error.code() > 4095) return EIO;
  return static_cast<int>(error.code());
}

}  // namespace platform::sandbox
