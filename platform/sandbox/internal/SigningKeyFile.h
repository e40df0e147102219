// The token-signing key on disk: 32 random bytes in a file that only its
// owner may read, made at first use. Whoever can read it can mint tokens, so
// a key file that others could read (or replace) is refused, not used.
//
// Thread safety: free functions; concurrent callers, in one process or
// several, end up with the same key.
#pragma once

#include <string>

#include "platform/sandbox/TokenSigner.h"
#include "platform/values/Result.h"

namespace platform::sandbox::internal {

// The key in `path`, made first (with its folder) when there is none. A new
// key is written under a temporary name and linked into place, so readers
// never see half a key and a concurrent maker never replaces another's.
// Errors are POSIX-domain with the reason in the description: EACCES for a
// file group or others may access or another user owns, EINVAL for one that
// is not a regular file or does not hold exactly 32 bytes, ELOOP for a
// symbolic link, and whatever a system call failed with.
Result<SigningKey> loadOrCreateSigningKey(const std::string& path);

}  // namespace platform::sandbox::internal
