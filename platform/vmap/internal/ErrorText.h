// Building vmap Errors with their location in the description and in the
// user information (see VmapError.h).
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <string>
#include <string_view>

#include "platform/values/Error.h"
#include "platform/vmap/VmapError.h"

namespace platform::vmap::internal {

// "LINE:COLUMN: what" (1-based).
Error errorAtLine(ErrorCode code, std::uint64_t line, std::uint64_t column, std::string_view what);
// "offset N: what" (0-based, from the start of the document).
Error errorAtOffset(ErrorCode code, std::uint64_t offset, std::string_view what);
// "what", no location.
Error errorPlain(ErrorCode code, std::string_view what);

// The same error with the path in front ("PATH:12:5: ...", "PATH: offset 3:
// ...", "PATH: ...") and in the user information.
Error withPath(const Error& error, std::string_view path);

// `text` in double quotes for a message: control characters and bytes of
// invalid UTF-8 escaped, and long text cut short with "..." so that one bad
// value cannot flood a log.
std::string quoted(std::string_view text);

}  // namespace platform::vmap::internal
