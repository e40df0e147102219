// The binary form: the magic followed by one CBOR data item (platform/cbor).
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <span>
#include <string>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace platform::vmap::internal {

// REQUIRES: bytes open with kBinaryMagic and bytes.size() <= limits.maxBytes.
Result<Value> readBinary(std::span<const std::uint8_t> bytes, const ReadLimits& limits);

Result<std::string> writeBinary(const Value& value, const WriteLimits& limits);

}  // namespace platform::vmap::internal
