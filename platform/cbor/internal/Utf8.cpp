#include "platform/cbor/internal/Utf8.h"

#include <cstring>

namespace platform::cbor::internal {
namespace {

inline bool isContinuation(std::uint8_t b) {
  return (b & 0xC0) == 0x80;
}

}  // namespace

std::size_t firstInvalidUtf8(const std::uint8_t* s, std::size_t n) {
  // Most keys and texts of the protocol are short and ASCII: one branch-free
  // pass settles those.
  if (n <= 32) {
    std::uint8_t any = 0;
    for (std::size_t k = 0; k < n; ++k) any |= s[k];
    if (any < 0x80) return n;
  }
  std::size_t i = 0;
  while (i < n) {
    // Skip ASCII a word at a time.
    if (i + 8 <= n) {
      std::uint64_t word;
      std::memcpy(&word, s + i, sizeof word);
      if ((word & 0x8080808080808080ull) == 0) {
        i += 8;
        continue;
      }
    }
    const std::uint8_t lead = s[i];
    if (lead < 0x80) {
      ++i;
      continue;
    }
    // The lead byte fixes the length and the range allowed for the second
    // byte, which is what excludes overlong forms, surrogates and values
    // beyond U+10FFFF.
    std::size_t length;
    std::uint8_t low = 0x80, high = 0xBF;
    if (lead >= 0xC2 && lead <= 0xDF) {
      length = 2;
    } else if (lead >= 0xE0 && lead <= 0xEF) {
      length = 3;
      if (lead == 0xE0) low = 0xA0;
      if (lead == 0xED) high = 0x9F;
    } else if (lead >= 0xF0 && lead <= 0xF4) {
      length = 4;
      if (lead == 0xF0) low = 0x90;
      if (lead == 0xF4) high = 0x8F;
    } else {
      return i;
    }
    if (n - i < length) return i;
    if (s[i + 1] < low || s[i + 1] > high) return i;
    for (std::size_t k = 2; k < length; ++k)
      if (!isContinuation(s[i + k])) return i;
    i += length;
  }
  return n;
}

}  // namespace platform::cbor::internal
