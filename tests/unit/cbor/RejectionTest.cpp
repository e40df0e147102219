// Everything outside the mapping is refused with the right code and the
// offset of the fault, in the user information and in the message; each
// limit holds exactly at its edge.
#include <gtest/gtest.h>

#include <string>
#include <tuple>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"

namespace platform::cbor {
namespace {

void expectRefused(const Result<Value>& v, ErrorCode code, std::uint64_t offset) {
  ASSERT_FALSE(v.ok());
  const Error& e = v.error();
  EXPECT_EQ(e.domain(), kErrorDomain);
  EXPECT_EQ(errorCodeOf(e), code) << e.description();
  EXPECT_EQ(errorOffsetOf(e), offset) << e.description();
  EXPECT_NE(e.description().find("at offset " + std::to_string(offset)), std::string::npos)
      << e.description();
}

TEST(CborRejects, EveryRuleWithItsOffset) {
  const struct {
    const char* hex;
    ErrorCode code;
    std::uint64_t offset;
  } cases[] = {
      {"", ErrorCode::kTruncated, 0},
      {"82 19 01 00", ErrorCode::kTruncated, 4},  // missing array element
      // Declared sizes that, were they believed, would reserve exabytes.
      {"bb 7f ff ff ff ff ff ff ff 61 61 00", ErrorCode::kTruncated, 0},
      {"81 7b 00 00 00 01 00 00 00 00 61", ErrorCode::kTruncated, 1},
      {"81 01 00 00", ErrorCode::kTrailingBytes, 2},
      {"63 ed a0 80", ErrorCode::kInvalidUtf8, 1},  // surrogate
      {"62 61 e2", ErrorCode::kInvalidUtf8, 2},     // cut by the string end
      {"a2 61 61 01 61 61 02", ErrorCode::kDuplicateKey, 4},
      {"a2 61 61 01 41 61 01", ErrorCode::kNonTextKey, 4},
      {"81 9f ff", ErrorCode::kIndefiniteLength, 1},
      {"c2 41 01", ErrorCode::kUnsupportedTag, 0},  // bignum
      {"82 01 f7", ErrorCode::kUnsupportedSimpleValue, 2},
      {"d8 25 51 00 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d 0e 0f 10", ErrorCode::kBadUuidLength, 0},
      {"d8 25 61 61", ErrorCode::kBadTagContent, 0},
      {"3b 80 00 00 00 00 00 00 00", ErrorCode::kIntegerOutOfRange, 0},
      {"81 5d", ErrorCode::kMalformedHead, 1},
      {"df", ErrorCode::kMalformedHead, 0},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.hex);
    expectRefused(decodeHex(c.hex), c.code, c.offset);
  }
}

TEST(CborRejects, MessagesNameTheCulprit) {
  auto dup = decodeHex("a3 61 61 01 62 62 62 02 62 62 62 03");
  ASSERT_FALSE(dup.ok());
  EXPECT_EQ(dup.error().description(), "duplicate map key \"bb\" at offset 8");
}

TEST(CborRejects, EncodingRefusesWhatCannotBeReadBackAndLeavesTheBufferAlone) {
  Dictionary inner;
  inner.set("list", Value(Array{Value(1), Value(), Value(3)}));
  const std::tuple<Value, ErrorCode, const char*> cases[] = {
      {Value(Dictionary{{"rules", Value(std::move(inner))}}), ErrorCode::kUnencodableValue,
       "(at /rules/list/1)"},
      {Value(Array{Value("ok"), Value(std::string("\xff"))}), ErrorCode::kInvalidUtf8, "(at /1)"},
  };
  for (const auto& [value, code, path] : cases) {
    std::vector<std::uint8_t> out = {0xAA, 0xBB};
    Status status = encode(value, out);
    ASSERT_FALSE(status.ok());
    EXPECT_EQ(errorCodeOf(status.error()), code);
    EXPECT_NE(status.error().description().find(path), std::string::npos)
        << status.error().description();
    EXPECT_EQ(out, (std::vector<std::uint8_t>{0xAA, 0xBB}));
  }
  // A key that is not UTF-8, deep inside, and values of every kind that can
  // travel.
  Dictionary badKey;
  badKey.set(std::string("k\xc0"), Value(1));
  EXPECT_FALSE(encode(Value(Array{Value(Dictionary{{"a", Value(badKey)}})})).ok());
  const Value good(Dictionary{{"n", Value(-5)}, {"u", Value(std::uint64_t{1} << 63)},
                              {"r", Value(1.5)}, {"b", Value(true)}, {"s", Value("é")},
                              {"a", Value(Array{})}, {"d", Value(Dictionary{})}});
  EXPECT_TRUE(encode(good).ok());
}

std::string repeat(const std::string& s, int n) {
  return n ? s + repeat(s, n - 1) : "";
}

TEST(CborLimits, DepthSixtyFourIsAcceptedAndSixtyFiveRefused) {
  EXPECT_TRUE(decodeHex(repeat("81 ", 64) + "00").ok());
  expectRefused(decodeHex(repeat("81 ", 64) + "80"), ErrorCode::kTooDeep, 64);
  expectRefused(decodeHex(repeat("a1 61 61 ", 65) + "f5"), ErrorCode::kTooDeep, 64 * 3);
  // Tags are not containers: a UUID at depth 64 is fine.
  EXPECT_TRUE(decodeHex(repeat("81 ", 64) + "d8 25 50" + repeat("00", 16)).ok());
  DecodeLimits two;
  two.maxDepth = 2;
  EXPECT_TRUE(decodeHex("81 81 01", two).ok());
  expectRefused(decodeHex("81 81 81 01", two), ErrorCode::kTooDeep, 2);
}

TEST(CborLimits, ItemCountAndInputSizeHoldAtTheirEdges) {
  DecodeLimits five;
  five.maxItems = 5;
  EXPECT_TRUE(decodeHex("84 01 02 03 04", five).ok());
  expectRefused(decodeHex("85 01 02 03 04 05", five), ErrorCode::kTooManyItems, 0);
  // A map counts itself, each key and each value; caught when the second
  // inner array declares its size.
  EXPECT_TRUE(decodeHex("a2 61 61 01 61 62 02", five).ok());
  expectRefused(decodeHex("82 82 01 02 81 03", five), ErrorCode::kTooManyItems, 4);
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

}  // namespace
}  // namespace platform::cbor
