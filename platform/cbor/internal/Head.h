// The building blocks of CBOR items shared by the decoder and the encoder:
// major types, additional-information values, the tags and simple values of
// the mapping, and big-endian head reading and writing.
//
// Thread safety: constants and pure inline functions.
#pragma once

#include <bit>
#include <cstddef>
#include <cstdint>
#include <cstring>

namespace platform::cbor::internal {

enum Major : std::uint8_t {
  kMajorUnsigned = 0,
  kMajorNegative = 1,
  kMajorBytes = 2,
  kMajorText = 3,
  kMajorArray = 4,
  kMajorMap = 5,
  kMajorTag = 6,
  kMajorSimple = 7,  // simple values and floats
};

// Additional information: below 24 the argument itself; 24-27 the argument
// follows in 1, 2, 4 or 8 bytes; 28-30 reserved; 31 indefinite / break.
inline constexpr std::uint8_t kInfoOneByte = 24;
inline constexpr std::uint8_t kInfoTwoBytes = 25;
inline constexpr std::uint8_t kInfoFourBytes = 26;
inline constexpr std::uint8_t kInfoEightBytes = 27;
inline constexpr std::uint8_t kInfoIndefinite = 31;

// Under major 7 the same values name the simple values and float widths.
inline constexpr std::uint8_t kSimpleFalse = 20;
inline constexpr std::uint8_t kSimpleTrue = 21;
inline constexpr std::uint8_t kSimpleNull = 22;
inline constexpr std::uint8_t kSimpleUndefined = 23;
inline constexpr std::uint8_t kFloat16 = kInfoTwoBytes;
inline constexpr std::uint8_t kFloat32 = kInfoFourBytes;
inline constexpr std::uint8_t kFloat64 = kInfoEightBytes;

inline constexpr std::uint64_t kTagEpochDate = 1;
inline constexpr std::uint64_t kTagUuid = 37;
inline constexpr std::size_t kUuidSize = 16;

// The longest head: one initial byte and an eight-byte argument.
inline constexpr std::size_t kMaxHeadSize = 9;

inline std::uint16_t loadBig16(const std::uint8_t* p) {
  return static_cast<std::uint16_t>((p[0] << 8) | p[1]);
}

inline std::uint32_t loadBig32(const std::uint8_t* p) {
  std::uint32_t v;
  std::memcpy(&v, p, sizeof v);
  return std::endian::native == std::endian::little ? __builtin_bswap32(v) : v;
}

inline std::uint64_t loadBig64(const std::uint8_t* p) {
  std::uint64_t v;
  std::memcpy(&v, p, sizeof v);
  return std::endian::native == std::endian::little ? __builtin_bswap64(v) : v;
}

inline void storeBig64(std::uint64_t v, std::uint8_t* p) {
  if constexpr (std::endian::native == std::endian::little) v = __builtin_bswap64(v);
  std::memcpy(p, &v, sizeof v);
}

// Writes the shortest head for `major` and `argument` to `out` (which has
// room for kMaxHeadSize bytes) and returns its length.
inline std::size_t writeHead(std::uint8_t major, std::uint64_t argument, std::uint8_t* out) {
  const std::uint8_t initial = static_cast<std::uint8_t>(major << 5);
  if (argument < kInfoOneByte) {
    out[0] = static_cast<std::uint8_t>(initial | argument);
    return 1;
  }
  if (argument <= 0xFF) {
    out[0] = initial | kInfoOneByte;
    out[1] = static_cast<std::uint8_t>(argument);
    return 2;
  }
  if (argument <= 0xFFFF) {
    out[0] = initial | kInfoTwoBytes;
    out[1] = static_cast<std::uint8_t>(argument >> 8);
    out[2] = static_cast<std::uint8_t>(argument);
    return 3;
  }
  if (argument <= 0xFFFFFFFF) {
    out[0] = initial | kInfoFourBytes;
    for (int i = 0; i < 4; ++i) out[1 + i] = static_cast<std::uint8_t>(argument >> (24 - 8 * i));
    return 5;
  }
  out[0] = initial | kInfoEightBytes;
  storeBig64(argument, out + 1);
  return 9;
}

// The major type as a phrase for error messages ("a text string").
inline const char* majorPhrase(std::uint8_t major) {
  static constexpr const char* kPhrases[] = {"an unsigned integer",
                                             "a negative integer",
                                             "a byte string",
                                             "a text string",
                                             "an array",
                                             "a map",
                                             "a tag",
                                             "a simple value or float"};
  return kPhrases[major & 7];
}

}  // namespace platform::cbor::internal
