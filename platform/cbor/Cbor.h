// The CBOR (RFC 8949) codec of the daemon's socket messages and of binary vmap
// documents. Clients in other languages speak it, so both directions keep to
// one exact mapping and the decoder refuses everything outside it:
//
//   Value kind   CBOR
//   ----------   -----------------------------------------------------------
//   Dictionary   map (major 5) with text-string keys, in insertion order
//   Array        array (major 4)
//   String       text string (major 3), valid UTF-8
//   Integer      major 0 when >= 0, major 1 when < 0
//   Unsigned     major 0 (decoded as Unsigned only above INT64_MAX)
//   Real         float; 64-bit when written, 16/32/64-bit when read
//   Boolean      simple values 20 (false) and 21 (true)
//   Date         tag 1 on a 64-bit float of seconds since 1970 (an integer or
//                any float width is accepted when read)
//   Data         byte string (major 2)
//   Uuid         tag 37 on a 16-byte byte string
//   None         never encoded; encoding one anywhere is an error
//
// Writers use the shortest head for every integer, length and tag; readers
// accept longer heads. Only definite lengths exist. Every input is untrusted:
// DecodeLimits bounds its size, nesting and item count, and a declared length
// larger than what is left of the input fails before anything is allocated.
//
// Thread safety: free functions without shared state; call from any thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <span>
#include <vector>

#include "platform/cbor/CborError.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::cbor {

struct DecodeLimits {
  // Longest input accepted at all.
  std::size_t maxBytes = 16u << 20;
  // Most arrays and maps open at once (a flat array is depth 1; a scalar, 0).
  // Decoding never recurses, but a Value is destroyed recursively: keep this
  // in the hundreds at most.
  std::size_t maxDepth = 64;
  // Most items: every array element, map key, map value and the top-level
  // item count once; a tag and the item it encloses count as one.
  std::size_t maxItems = 1'000'000;
};

// Decodes exactly one item that fills `bytes`. Errors are ErrorCode values
// of domain kErrorDomain with the failing offset in the user information.
// Runs in time linear in the input and never recurses.
platform::Result<platform::Value> decode(std::span<const std::uint8_t> bytes,
                                         const DecodeLimits& limits = {});

// Appends the encoding of `value` to `out`. On error (a none value, or a
// string or key that is not UTF-8) `out` is left as it was and the message
// names the path of the offending value ("/rules/3/name").
platform::Status encode(const platform::Value& value, std::vector<std::uint8_t>& out);

// The encoding of `value` in a new buffer.
platform::Result<std::vector<std::uint8_t>> encode(const platform::Value& value);

}  // namespace platform::cbor
