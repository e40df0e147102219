// UTF-8 decoding and the XML 1.0 character set, for the writers' checks.
//
// Thread safety: pure functions.
#pragma once

#include <cstddef>
#include <string_view>

namespace platform::vmap::internal {

// Decodes the sequence starting at text[at]: returns its length (1-4) and
// stores the code point, or returns 0 when the sequence is invalid (truncated,
// overlong, a surrogate, or beyond U+10FFFF).
// REQUIRES: at < text.size().
std::size_t decodeUtf8(std::string_view text, std::size_t at, char32_t& codePoint);

// The offset of the first invalid sequence, or text.size() when all is valid.
std::size_t findInvalidUtf8(std::string_view text);

// Whether XML 1.0 can carry the code point at all (as text or as a
// character reference).
inline bool isXmlChar(char32_t c) {
  if (c < 0x20) return c == 0x9 || c == 0xA || c == 0xD;
  if (c >= 0xD800 && c <= 0xDFFF) return false;
  return c != 0xFFFE && c != 0xFFFF && c <= 0x10FFFF;
}

}  // namespace platform::vmap::internal
