// The counter files behind notifications: <directory>/<name> holds the
// number of posts so far as decimal text and a newline ("42\n"). Every
// change and every read happens under flock on the file (exclusive to
// post, shared to read), so posts from any number of processes add up.
//
// A post rewrites the number in place with one pwrite. Counts only grow, so
// the new text is never shorter than the old and no truncation is needed; a
// process killed at any point leaves either the old number or the new one.
// The files live under run/, which does not survive a reboot.
//
// Thread safety: pure functions over the file system; safe from any thread.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Result.h"

namespace platform::notify::internal {

// Creates `directory` and its missing parents (mode 0755).
// REQUIRES: directory is absolute.
Status makeDirectories(const std::string& directory);

// Adds one to the counter at `path` and returns the new count. A counter
// that does not hold a number starts again from zero (the fault is logged).
// REQUIRES: the directory of `path` exists.
Result<std::uint64_t> incrementCounter(const std::string& path);

// The count at `path`; 0 when the file is missing or empty.
Result<std::uint64_t> readCounter(const std::string& path);

// The count in `text` ("42", "42\n"); none when it is not one.
std::optional<std::uint64_t> parseCount(std::string_view text);

}  // namespace platform::notify::internal
