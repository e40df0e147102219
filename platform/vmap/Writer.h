// Writing a Value as a vmap document.
//
// Thread safety: the functions share no state; call them from any thread.
//
// What is written reads back (Reader.h) as an equal Value. Writing refuses
// what could not: a none value anywhere, invalid UTF-8 in a string or key,
// nesting deeper than the limit, and, in the XML form only, characters that
// XML 1.0 cannot carry (control characters other than tab, line feed and
// carriage return; U+FFFE, U+FFFF) and dates outside the years 0000-9999 or
// not expressible exactly as decimal text. The binary form carries all of
// those but the first three. Faults are Errors of kErrorDomain.
#pragma once

#include <cstddef>
#include <string>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/Format.h"
#include "platform/vmap/Reader.h"

namespace platform::vmap {

struct WriteLimits {
  // Deeper values are refused, so that nothing is written that a reader with
  // the default limits would refuse.
  std::size_t maxDepth = kDefaultMaxDepth;
};

// The whole document: XML text ending in a newline, or the binary form's
// bytes (held in a std::string).
//
// The XML layout: the declaration, <vmap version="1.0">, the root value at
// column 0, each nested element one tab further in, and </vmap>. Empty
// containers are written as <array/> and <dict/>; reals in the shortest text
// that reads back the same value ("nan", "inf" and "-inf" when not finite).
Result<std::string> write(const Value& value, Format format, const WriteLimits& limits = {});

}  // namespace platform::vmap
