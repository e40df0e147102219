// Replacing a file so that readers see the old contents or the new, never a
// mixture, and so that the new contents survive a crash once this returns.
//
// Thread safety: safe to call from any thread; two concurrent replacements of
// the same path each leave a complete file (the later rename wins).
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <span>
#include <string>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/FileOps.h"
#include "platform/vmap/Format.h"

namespace platform::vmap {

inline constexpr mode_t kDefaultFileMode = 0644;

// Writes `bytes` to a new temporary file in the target's directory, fsyncs
// it, renames it over `path` and fsyncs the directory. On a failure before
// the rename, the old file (if any) is untouched and the temporary file is
// removed. A failure of the final directory fsync is reported too, though the
// new contents are then already in place (but may not be durable).
// REQUIRES: path is absolute and names a file, not a directory (refused as
// InvalidArgument otherwise).
Status writeBytesAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                            FileOps& ops = FileOps::real(), mode_t mode = kDefaultFileMode);

// Writes `value` in `format` (see Writer.h) and replaces `path` with it as
// above. A value the format cannot carry fails before any file is touched.
Status writeFileAtomically(const std::string& path, const Value& value, Format format,
                           FileOps& ops = FileOps::real(), mode_t mode = kDefaultFileMode);

}  // namespace platform::vmap
