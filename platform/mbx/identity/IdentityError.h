// Errors of peer identification that are not a failed system call (those are
// POSIX-domain errors naming the call): one domain, a code per way a peer can
// fail to be identified.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"

namespace platform::mbx {

inline constexpr std::string_view kIdentityErrorDomain = "com.corvane.mbx.identity";

// Callers match on these: never renumber.
enum class IdentityErrorCode : std::int64_t {
  // The peer exited (or was reaped) before every fact about it was read. The
  // daemon cancels such a connection.
  PeerExited = 1,
  // The kernel reported no pid for the peer (the socket is not connected, or
  // the peer lives in a pid namespace the daemon cannot see), so nothing
  // about it can be read.
  PeerNotVisible = 2,
  // The start time read at the end differs from the one read first.
  StartTimeMismatch = 3,
  // The process under the peer's pid started after the connection was
  // accepted: the peer exited and its pid was given to someone else.
  PidReused = 4,
  // The peer ran another program while its identity was being taken.
  ExecutableChanged = 5,
  // A /proc file did not have the expected form.
  MalformedProcFile = 6,
  // A /proc file, a link or a label was longer than its limit.
  TooLong = 7,
  // The executable link did not read as an absolute path.
  ExecutableNotAbsolute = 8,
  // The directory opened as /proc is not a proc file system.
  ProcNotMounted = 9,
  // The pinned process is not the one /proc/<pid> shows (a /proc of another
  // pid namespace).
  PidfdMismatch = 10,
};

// "peer exited", "start time mismatch", ...: a short name for logs and tests.
const char* identityErrorCodeName(IdentityErrorCode code);

// An error of kIdentityErrorDomain with `code`, described by `message`.
Error identityError(IdentityErrorCode code, std::string message);

// True when `error` is of kIdentityErrorDomain with `code`.
bool isIdentityError(const Error& error, IdentityErrorCode code);

}  // namespace platform::mbx
