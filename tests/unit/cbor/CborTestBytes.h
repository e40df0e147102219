// Shared by the CBOR tests: hex-written inputs and a decode shorthand.
#pragma once

#include <cstdint>
#include <cstdio>
#include <string>
#include <string_view>
#include <vector>

#include "platform/cbor/Cbor.h"

namespace platform::cbor {

// "a1 61 61 01" -> {0xa1, 0x61, 0x61, 0x01}; spaces are ignored.
inline std::vector<std::uint8_t> hexBytes(std::string_view hex) {
  std::vector<std::uint8_t> out;
  std::string digits;
  for (char c : hex)
    if (c != ' ') digits.push_back(c);
  for (std::size_t i = 0; i + 1 < digits.size(); i += 2)
    out.push_back(static_cast<std::uint8_t>(std::stoul(digits.substr(i, 2), nullptr, 16)));
  return out;
}

inline std::string toHex(const std::vector<std::uint8_t>& bytes) {
  std::string out;
  char buf[4];
  for (std::uint8_t b : bytes)
    out += (std::snprintf(buf, sizeof buf, "%s%02x", out.empty() ? "" : " ", b), buf);
  return out;
}

inline Result<Value> decodeHex(std::string_view hex, const DecodeLimits& limits = {}) {
  return decode(hexBytes(hex), limits);
}

}  // namespace platform::cbor
