// Reading a vmap document that grants privileges: the file is opened once,
// and the trust rule, the size limit and the reading all apply to that one
// open file, so that nobody can swap the file between the check and the read.
//
// Thread safety: pure functions over the file system; safe from any thread.
#pragma once

#include <sys/types.h>

#include <string>

#include "platform/codesign/internal/FileSignature.h"
#include "platform/values/Result.h"
#include "platform/vmap/Reader.h"

namespace platform::codesign::internal {

// The document at `name`, opened relative to `directoryFd` (AT_FDCWD with an
// absolute name for a lone file); `path` names it in error messages.
// Symbolic links are not followed: a link is not a
// configuration file, and following one would let a user point at a file
// that root wrote for another purpose. Fails with a POSIX error when the
// file cannot be opened (ENOENT when it is missing), or with a CodesignError:
// NotARegularFile, Untrusted (see FileTrust.h), TooLarge (past
// limits.maxBytes) or Malformed (the vmap reader's message, after the path).
// `signature`, when given, receives the opened file's signature whenever the
// file could be opened, whatever the outcome.
// REQUIRES: directoryFd is AT_FDCWD or an open directory.
Result<Value> readTrustedDocument(int directoryFd, const std::string& name, const std::string& path,
                                  uid_t daemonUid, const vmap::ReadLimits& limits,
                                  FileSignature* signature = nullptr);

}  // namespace platform::codesign::internal
