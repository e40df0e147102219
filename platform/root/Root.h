// The platform root: every system location lies under it, so that a test or
// a demo can run a whole system inside a temporary directory.
//
// Thread safety: safe from any thread; the root is read from the environment
// once, unless a test overrides it.
#pragma once

#include <string>
#include <string_view>

namespace platform {

// The value of QV_ROOT (default "/"), without a trailing separator unless it
// is "/" itself.
const std::string& rootDirectory();

// `relative` (without a leading '/') under the root: rootPath("var/db/x")
// is "/var/db/x" for the root "/" and "/tmp/r/var/db/x" for "/tmp/r".
std::string rootPath(std::string_view relative);

// Replaces the root for this process; later calls see the new one.
// REQUIRES: no other thread is reading the root at the same time.
void setRootDirectoryForTesting(std::string root);

}  // namespace platform
