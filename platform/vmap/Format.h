// The two forms of a vmap document and how to tell them apart.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <optional>
#include <span>
#include <string_view>

namespace platform::vmap {

enum class Format {
  Xml,     // hand-editable text: <?xml ...?><vmap version="1.0">...</vmap>
  Binary,  // the magic "vmapbin1" followed by one CBOR data item
};

// The eight bytes that open every binary-form document. An array, not a
// literal: a string_view of a literal may point at a different copy of it in
// each translation unit, and clang under ASan has been seen mixing two such
// copies in one begin()/end() pair.
inline constexpr char kBinaryMagicBytes[8] = {'v', 'm', 'a', 'p', 'b', 'i', 'n', '1'};
inline constexpr std::string_view kBinaryMagic(kBinaryMagicBytes, sizeof kBinaryMagicBytes);

// Binary when the bytes open with the magic; XML when the first byte after an
// optional UTF-8 byte-order mark and white space is '<'; otherwise none.
std::optional<Format> detectFormat(std::span<const std::uint8_t> bytes);

const char* formatName(Format format);  // "xml" or "binary"

}  // namespace platform::vmap
