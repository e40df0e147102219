// Sandbox extensions: a token, issued by a process that has some access, that
// another process consumes to gain that access too. The daemon issues read
// access to plug-in files and the right to look up a plug-in's service; hosts
// consume what they are handed. LinuxSandboxExtensions signs and verifies
// tokens with a key under the platform root; testing/FakeSandboxExtensions
// records what was asked of it.
//
// Every failure is an error of the POSIX domain whose code is the errno value
// (sandboxErrno), so that callers can print the system's text for it.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::sandbox {

// The class under which read-only file extensions are issued.
inline constexpr std::string_view kReadOnlyFileExtensionClass = "com.corvane.sandbox.read-only";

// Whether a file extension names the path as given or its canonical form
// (symbolic links, "." and ".." resolved; the path must then exist).
enum class PathResolution { AsGiven, Canonicalise };

class SandboxExtensions {
 public:
  virtual ~SandboxExtensions() = default;

  // A token granting read access to `path` and what lies below it.
  // REQUIRES: path is absolute (a relative one fails with EINVAL).
  virtual Result<std::string> issueFileExtension(std::string_view path,
                                                 PathResolution resolution) const = 0;

  // A token granting the right to look up the service `serviceName`, issued
  // under `extensionClass`.
  virtual Result<std::string> issueServiceExtension(std::string_view extensionClass,
                                                    std::string_view serviceName) const = 0;

  // Takes up the access `token` grants; the handle (never -1) names it until
  // it is released. A malformed or over-long token fails with EINVAL, a forged
  // or altered one with EPERM.
  virtual Result<std::int64_t> consume(std::string_view token) = 0;

  // Gives up a consumed access. An unknown or already released handle fails
  // with EBADF.
  virtual Status release(std::int64_t handle) = 0;
};

// The errno value an error of this layer carries (EIO for any other error).
int sandboxErrno(const Error& error);

}  // namespace platform::sandbox
