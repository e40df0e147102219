// Canonical forms of paths, so that the same file is named the same way
// whichever symbolic links or "." and ".." a caller went through.
//
// Thread safety: pure functions over the file system; safe from any thread.
#pragma once

#include <string>
#include <string_view>

namespace platform::codesign::internal {

// `path` with "//", "." and ".." folded away and no trailing separator,
// without asking the file system ("/a/./b/../c/" -> "/a/c").
// REQUIRES: path is absolute.
std::string lexicallyNormal(std::string_view path);

// realpath(path) when the file exists; otherwise lexicallyNormal(path), so
// that a grant for a program not installed yet still names it exactly.
// REQUIRES: path is absolute.
std::string canonicalPath(std::string_view path);

}  // namespace platform::codesign::internal
