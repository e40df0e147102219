// The trust rule for files that grant privileges: such a file counts only
// when nobody but root or the daemon's own user can have written it, that is
// when it is owned by one of them and is writable neither by its group nor by
// others. Anything else could have been planted or edited by an ordinary
// user, so it is ignored, never half-believed.
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include <sys/stat.h>
#include <sys/types.h>

#include <optional>
#include <string>

namespace platform::codesign {

// Why the file described by `status` fails the trust rule ("owned by uid
// 65534, neither root nor the daemon's uid 0", "writable by others (mode
// 0646)"), or none when it passes. `daemonUid` is the daemon's effective uid.
std::optional<std::string> distrustReason(const struct stat& status, uid_t daemonUid);

}  // namespace platform::codesign
