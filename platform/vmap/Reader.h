// Reading vmap documents in either form into a Value.
//
// Thread safety: the functions share no state; call them from any thread.
//
// Every fault is an Error of kErrorDomain (see VmapError.h) whose description
// locates it: "12:5: unknown element <strnig>" for the XML form,
// "offset 17: duplicate map key "a"" for the binary form, with the path in
// front when the document came from a file. Operating-system faults while
// reading a file are errors of kPosixErrorDomain ("PATH: No such file ...").
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <string>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/VmapError.h"

namespace platform::vmap {

inline constexpr std::size_t kDefaultMaxBytes = 16u << 20;
inline constexpr std::size_t kDefaultMaxDepth = 64;
inline constexpr std::size_t kDefaultMaxItems = 1'000'000;

struct ReadLimits {
  // Larger documents are refused; a file is refused by its size before any
  // of it is read into memory.
  std::size_t maxBytes = kDefaultMaxBytes;
  // Containers (dictionaries and arrays) nested deeper than this are refused.
  // A lone scalar has depth 0, a dictionary of scalars depth 1.
  std::size_t maxDepth = kDefaultMaxDepth;
  // Most values in the document, every dictionary key and value and every
  // array element counted (the root too).
  std::size_t maxItems = kDefaultMaxItems;
};

// Reads a document of either form from memory.
Result<Value> read(std::span<const std::uint8_t> bytes, const ReadLimits& limits = {});

// Reads the regular file at `path` (symbolic links are followed; devices,
// FIFOs and directories are refused without being opened for long).
// REQUIRES: path is absolute (a relative one is refused as InvalidArgument).
Result<Value> readFile(const std::string& path, const ReadLimits& limits = {});

}  // namespace platform::vmap
