// Widening of the 16- and 32-bit floats a reader accepts to the double a
// Value holds. Both are exact: every half and single value is a double.
//
// Thread safety: pure inline functions.
#pragma once

#include <bit>
#include <cmath>
#include <cstdint>

namespace platform::cbor::internal {

// IEEE 754 binary16 bits to double, NaN payloads and signed zeros kept.
inline double halfToDouble(std::uint16_t half) {
  const std::uint64_t sign = static_cast<std::uint64_t>(half >> 15) << 63;
  const unsigned exponent = (half >> 10) & 0x1F;
  const std::uint64_t mantissa = half & 0x3FF;
  if (exponent == 0) {
    // Zero or subnormal: mantissa * 2^-24, exact in a double.
    double magnitude = std::ldexp(static_cast<double>(mantissa), -24);
    return sign ? -magnitude : magnitude;
  }
  std::uint64_t bits;
  if (exponent == 0x1F) {
    bits = sign | (std::uint64_t{0x7FF} << 52) | (mantissa << 42);  // infinity or NaN
  } else {
    bits = sign | (static_cast<std::uint64_t>(exponent - 15 + 1023) << 52) | (mantissa << 42);
  }
  return std::bit_cast<double>(bits);
}

inline double singleToDouble(std::uint32_t single) {
  return static_cast<double>(std::bit_cast<float>(single));
}

}  // namespace platform::cbor::internal
