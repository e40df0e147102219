// Each limit holds exactly at its edge, and hostile declared sizes fail
// before the decoder allocates for them.
#include <gtest/gtest.h>

#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"

namespace platform::cbor {
namespace {

std::string repeat(const std::string& s, std::size_t n) {
  std::string out;
  for (std::size_t i = 0; i < n; ++i) out += s;
  return out;
}

void expectRefused(const Result<Value>& v, ErrorCode code, std::uint64_t offset) {
  ASSERT_FALSE(v.ok());
  EXPECT_EQ(errorCodeOf(v.error()), code) << v.error().description();
  EXPECT_EQ(errorOffsetOf(v.error()), offset) << v.error().description();
}

TEST(CborLimits, DepthSixtyFourIsAcceptedAndSixtyFiveRefused) {
  // Arrays, maps, and empty innermost containers all count.
  EXPECT_TRUE(decodeHex(repeat("81 ", 64) + "00").ok());
  expectRefused(decodeHex(repeat("81 ", 65) + "00"), ErrorCode::kTooDeep, 64);
  expectRefused(decodeHex(repeat("81 ", 64) + "80"), ErrorCode::kTooDeep, 64);
  EXPECT_TRUE(decodeHex(repeat("a1 61 61 ", 64) + "f5").ok());
  expectRefused(decodeHex(repeat("a1 61 61 ", 65) + "f5"), ErrorCode::kTooDeep, 64 * 3);
  // Tags are not containers: a UUID at depth 64 is fine.
  EXPECT_TRUE(decodeHex(repeat("81 ", 64) + "d8 25 50" + repeat("00", 16)).ok());
}

TEST(CborLimits, DepthLimitIsConfigurable) {
  DecodeLimits two;
  two.maxDepth = 2;
  EXPECT_TRUE(decodeHex("81 81 01", two).ok());
  expectRefused(decodeHex("81 81 81 01", two), ErrorCode::kTooDeep, 2);
  // Far beyond the default. (Not deeper: a Value is destroyed recursively.)
  DecodeLimits deep;
  deep.maxDepth = 1000;
  EXPECT_TRUE(decode(hexBytes(repeat("81", 1000) + "00"), deep).ok());
  expectRefused(decode(hexBytes(repeat("81", 1001) + "00"), deep), ErrorCode::kTooDeep, 1000);
}

TEST(CborLimits, ItemCountHoldsAtItsEdge) {
  DecodeLimits five;
  five.maxItems = 5;
  EXPECT_TRUE(decodeHex("84 01 02 03 04", five).ok());
  expectRefused(decodeHex("85 01 02 03 04 05", five), ErrorCode::kTooManyItems, 0);
  // A map counts itself, each key and each value.
  EXPECT_TRUE(decodeHex("a2 61 61 01 61 62 02", five).ok());
  DecodeLimits four;
  four.maxItems = 4;
  expectRefused(decodeHex("a2 61 61 01 61 62 02", four), ErrorCode::kTooManyItems, 0);
  // Caught when the second inner array declares its size: 1 + 1 + 2 + 1 + 1 > 5.
  expectRefused(decodeHex("82 82 01 02 81 03", five), ErrorCode::kTooManyItems, 4);
  // A tag and what it encloses are one item.
  DecodeLimits two;
  two.maxItems = 2;
  EXPECT_TRUE(decodeHex("81 c1 00", two).ok());
  // The default: a million items fit, one more does not.
  std::vector<std::uint8_t> million = hexBytes("9a 00 0f 42 3f");
  million.resize(million.size() + 999'999, 0x00);
  EXPECT_TRUE(decode(million).ok());
  std::vector<std::uint8_t> tooMany = hexBytes("9a 00 0f 42 40");
  tooMany.resize(tooMany.size() + 1'000'000, 0x00);
  expectRefused(decode(tooMany), ErrorCode::kTooManyItems, 0);
}

TEST(CborLimits, InputSizeHoldsAtItsEdge) {
  DecodeLimits three;
  three.maxBytes = 3;
  EXPECT_TRUE(decodeHex("62 61 62", three).ok());
  expectRefused(decodeHex("63 61 62 63", three), ErrorCode::kTooLarge, 3);
  std::vector<std::uint8_t> atLimit = hexBytes("5a 00 ff ff fb");
  atLimit.resize(16u << 20, 0x00);
  EXPECT_TRUE(decode(atLimit).ok());
  atLimit[4] = 0xfc;
  atLimit.push_back(0x00);
  expectRefused(decode(atLimit), ErrorCode::kTooLarge, 16u << 20);
}

TEST(CborLimits, DeclaredSizesBeyondTheInputFailBeforeAllocating) {
  // Were any of these believed, the decoder would reserve exabytes.
  expectRefused(decodeHex("9b ff ff ff ff ff ff ff ff 00"), ErrorCode::kTruncated, 0);
  expectRefused(decodeHex("bb 7f ff ff ff ff ff ff ff 61 61 00"), ErrorCode::kTruncated, 0);
  expectRefused(decodeHex("5b ff ff ff ff ff ff ff ff 00"), ErrorCode::kTruncated, 0);
  expectRefused(decodeHex("81 7b 00 00 00 01 00 00 00 00 61"), ErrorCode::kTruncated, 1);
  // A map needs two bytes per pair: three pairs cannot fit in five bytes.
  expectRefused(decodeHex("a3 61 61 01 61 62"), ErrorCode::kTruncated, 0);
}

}  // namespace
}  // namespace platform::cbor
