// Parsing of one conversion ("%-08.3{public}..." etc.) out of a
// format string.
//
// Thread safety: pure functions; safe from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string_view>

namespace platform::log::internal {

enum class ConversionStatus : std::uint8_t {
  Ok,             // a conversion that takes one argument
  Percent,        // "%%"
  Incomplete,     // the format ended inside the conversion
  BadAnnotation,  // "{" without "}" within kMaxAnnotationBytes
  Unknown,        // an unknown conversion character
  Star,           // '*' width or precision: refused
  TooWide,        // width or precision over kMaxFieldWidth
};

enum class Privacy : std::uint8_t { Unmarked, Public, Private };

inline constexpr std::size_t kMaxAnnotationBytes = 64;

struct Conversion {
  ConversionStatus status = ConversionStatus::Incomplete;
  // Bytes of the format the conversion spans, '%' included; at least 1.
  std::size_t length = 1;
  char conversion = 0;  // 'd', 's', '@', ... (Unknown: the offending byte)
  // Flags, in printf terms.
  bool leftAlign = false;
  bool plusSign = false;
  bool spaceSign = false;
  bool alternate = false;
  bool zeroPad = false;
  int width = -1;      // -1: none
  int precision = -1;  // -1: none
  int starCount = 0;   // Star: how many '*' (each consumes an argument in C)
  Privacy privacy = Privacy::Unmarked;
  bool uuid = false;        // {uuid_t}
  bool errnoValue = false;  // {errno}
};

// Parses the conversion that starts at text[0].
// REQUIRES: !text.empty() && text[0] == '%'.
Conversion parseConversion(std::string_view text);

}  // namespace platform::log::internal
