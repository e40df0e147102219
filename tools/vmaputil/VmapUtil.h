// The vmaputil command line: print, convert, lint and query vmap documents.
//
// Thread safety: runVmapUtil writes to the given streams; run one at a time
// per pair of streams.
#pragma once

#include <cstdio>
#include <span>
#include <string_view>

namespace platform::vmap {

// Exit statuses: 0 success, 1 a document (or file) error, 2 a usage error.
enum ExitStatus : int { kExitOk = 0, kExitDocumentError = 1, kExitUsage = 2 };

// Runs the tool on `args` (without the program name), writing results to
// `out` and diagnostics to `err`.
int runVmapUtil(std::span<const std::string_view> args, std::FILE* out, std::FILE* err);

}  // namespace platform::vmap
