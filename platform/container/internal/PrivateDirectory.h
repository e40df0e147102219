// Making the directories of a container without following symbolic links
// where a user could have planted one.
//
// Thread safety: pure functions over the file system; safe from any thread.
#pragma once

#include <sys/types.h>

#include <string>

#include "platform/values/Result.h"

namespace platform::container::internal {

// Creates `directory` and its missing parents with `mode` (exactly: the
// umask does not apply). Existing directories are left as they are.
// REQUIRES: directory is absolute.
Status makeSharedDirectories(const std::string& directory, mode_t mode);

// Opens the directory `name` in `parentFd`, first making it with mode 0700
// (and, when `owner` is not -1, chowning it to `owner`) if missing. Returns
// the open directory, owned by the caller. A symbolic link or a file there
// fails as NotADirectory. `path` names it in errors.
Result<int> openPrivateDirectory(int parentFd, const std::string& name, const std::string& path,
                                 uid_t owner);

}  // namespace platform::container::internal
