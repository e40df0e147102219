// UTF-8 validation for text strings: RFC 3629 well-formedness, so overlong
// forms, surrogates (U+D800-U+DFFF) and code points above U+10FFFF are bad.
//
// Thread safety: a pure function.
#pragma once

#include <cstddef>
#include <cstdint>

namespace platform::cbor::internal {

// The offset of the first byte of the first ill-formed sequence in
// [bytes, bytes + size), or `size` when all of it is valid UTF-8.
// REQUIRES: bytes is readable for size bytes (or size is 0).
std::size_t firstInvalidUtf8(const std::uint8_t* bytes, std::size_t size);

}  // namespace platform::cbor::internal
