// Base64 (the standard alphabet, with padding) for <data> elements.
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/values/Value.h"

namespace platform::vmap::internal {

// Appends the encoding of `bytes`, padded, on one line.
void appendBase64(std::string& out, std::span<const std::uint8_t> bytes);

// Decodes `text`, skipping XML white space anywhere in it. Refuses characters
// outside the alphabet, padding anywhere but at the end, and a length (less
// white space) that is not a multiple of four. On failure returns false and
// says why in `why`.
bool decodeBase64(std::string_view text, Data& out, std::string& why);

}  // namespace platform::vmap::internal
