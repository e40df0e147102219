// Reading the XML form with expat.
//
// Thread safety: each call builds its own parser; no shared state.
#pragma once

#include <cstdint>
#include <span>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/Reader.h"

namespace platform::vmap::internal {

// REQUIRES: bytes.size() <= limits.maxBytes (the caller checks).
Result<Value> readXml(std::span<const std::uint8_t> bytes, const ReadLimits& limits);

}  // namespace platform::vmap::internal
