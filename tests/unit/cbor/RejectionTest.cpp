// Everything outside the mapping is refused with the right code and the
// offset of the fault, both in the user information and in the message.
#include <gtest/gtest.h>

#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"

namespace platform::cbor {
namespace {

struct RejectCase {
  const char* what;
  const char* hex;
  ErrorCode code;
  std::uint64_t offset;
};

const RejectCase kCases[] = {
    {"empty input", "", ErrorCode::kTruncated, 0},
    {"head cut short", "19 01", ErrorCode::kTruncated, 0},
    {"text cut short", "63 61 62", ErrorCode::kTruncated, 0},
    {"array longer than input", "82 01", ErrorCode::kTruncated, 0},
    {"missing array element", "82 19 01 00", ErrorCode::kTruncated, 4},
    {"missing map value", "a1 61 61", ErrorCode::kTruncated, 3},
    {"trailing after array", "81 01 00 00", ErrorCode::kTrailingBytes, 2},
    {"bad continuation", "62 c3 28", ErrorCode::kInvalidUtf8, 1},
    {"overlong form", "62 c0 80", ErrorCode::kInvalidUtf8, 1},
    {"overlong three-byte form", "63 e0 80 80", ErrorCode::kInvalidUtf8, 1},
    {"surrogate", "63 ed a0 80", ErrorCode::kInvalidUtf8, 1},
    {"beyond U+10FFFF", "64 f4 90 80 80", ErrorCode::kInvalidUtf8, 1},
    {"sequence cut by the string end", "62 61 e2", ErrorCode::kInvalidUtf8, 2},
    {"bad byte after ASCII", "6a 61 62 63 64 65 66 67 68 69 ff", ErrorCode::kInvalidUtf8, 10},
    {"bad key", "a1 61 ff 01", ErrorCode::kInvalidUtf8, 2},
    {"duplicate key", "a2 61 61 01 61 61 02", ErrorCode::kDuplicateKey, 4},
    {"byte string key", "a2 61 61 01 41 61 01", ErrorCode::kNonTextKey, 4},
    {"indefinite bytes", "5f 41 61 ff", ErrorCode::kIndefiniteLength, 0},
    {"indefinite array", "81 9f ff", ErrorCode::kIndefiniteLength, 1},
    {"stray break", "ff", ErrorCode::kIndefiniteLength, 0},
    {"bignum tag", "c2 41 01", ErrorCode::kUnsupportedTag, 0},
    {"nested URI tag", "81 d8 20 61 61", ErrorCode::kUnsupportedTag, 1},
    {"null", "f6", ErrorCode::kUnsupportedSimpleValue, 0},
    {"undefined", "82 01 f7", ErrorCode::kUnsupportedSimpleValue, 2},
    {"one-byte simple", "f8 ff", ErrorCode::kUnsupportedSimpleValue, 0},
    {"15-byte UUID", "d8 25 4f 00 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d 0e",
     ErrorCode::kBadUuidLength, 0},
    {"17-byte UUID", "d8 25 51 00 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d 0e 0f 10",
     ErrorCode::kBadUuidLength, 0},
    {"UUID on text", "d8 25 61 61", ErrorCode::kBadTagContent, 0},
    {"date on text", "c1 61 61", ErrorCode::kBadTagContent, 0},
    {"date on a tag", "c1 c1 00", ErrorCode::kBadTagContent, 0},
    {"below INT64_MIN", "3b 80 00 00 00 00 00 00 00", ErrorCode::kIntegerOutOfRange, 0},
    {"date below INT64_MIN", "c1 3b 80 00 00 00 00 00 00 00", ErrorCode::kIntegerOutOfRange, 1},
    {"reserved 28", "1c", ErrorCode::kMalformedHead, 0},
    {"reserved 29 nested", "81 5d", ErrorCode::kMalformedHead, 1},
    {"31 on an unsigned", "1f", ErrorCode::kMalformedHead, 0},
    {"31 on a tag", "df", ErrorCode::kMalformedHead, 0},
    {"reserved 28 in major 7", "fc", ErrorCode::kMalformedHead, 0},
};

TEST(CborRejects, EveryRuleWithItsOffset) {
  for (const auto& c : kCases) {
    SCOPED_TRACE(c.what);
    auto v = decodeHex(c.hex);
    ASSERT_FALSE(v.ok());
    const Error& e = v.error();
    EXPECT_EQ(e.domain(), kErrorDomain);
    EXPECT_EQ(errorCodeOf(e), c.code) << e.description();
    EXPECT_EQ(errorOffsetOf(e), c.offset) << e.description();
    EXPECT_NE(e.description().find("at offset " + std::to_string(c.offset)), std::string::npos)
        << e.description();
  }
}

TEST(CborRejects, MessagesNameTheCulprit) {
  auto dup = decodeHex("a3 61 61 01 62 62 62 02 62 62 62 03");
  ASSERT_FALSE(dup.ok());
  EXPECT_EQ(dup.error().description(), "duplicate map key \"bb\" at offset 8");
  auto tag = decodeHex("d8 20 00");
  ASSERT_FALSE(tag.ok());
  EXPECT_NE(tag.error().description().find("tag 32"), std::string::npos);
  auto longKey = decode(
      hexBytes("a2 78 64" + std::string(200, '6') + " 01 78 64" + std::string(200, '6') + " 02"));
  ASSERT_FALSE(longKey.ok());
  EXPECT_EQ(errorCodeOf(longKey.error()), ErrorCode::kDuplicateKey);
  EXPECT_LT(longKey.error().description().size(), 120u);  // long keys are cut in messages
}

TEST(CborRejects, EncodingRefusesWhatCannotBeReadBackAndLeavesTheBufferAlone) {
  Dictionary inner;
  inner.set("list", Value(Array{Value(1), Value(), Value(3)}));
  Dictionary outer;
  outer.set("rules", Value(std::move(inner)));
  const struct {
    Value value;
    ErrorCode code;
    const char* path;
  } cases[] = {
      {Value(), ErrorCode::kUnencodableValue, "(at /)"},
      {Value(std::move(outer)), ErrorCode::kUnencodableValue, "(at /rules/list/1)"},
      {Value(Array{Value(std::string("ok")), Value(std::string("\xff"))}), ErrorCode::kInvalidUtf8,
       "(at /1)"},
      {Value(Dictionary{{"a", Value(1)}, {"\xed\xa0\x80", Value(2)}}), ErrorCode::kInvalidUtf8,
       "(at /\xed\xa0\x80)"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.path);
    std::vector<std::uint8_t> out = {0xAA, 0xBB};
    Status status = encode(c.value, out);
    ASSERT_FALSE(status.ok());
    EXPECT_EQ(errorCodeOf(status.error()), c.code);
    EXPECT_NE(status.error().description().find(c.path), std::string::npos)
        << status.error().description();
    EXPECT_EQ(out, (std::vector<std::uint8_t>{0xAA, 0xBB}));
    EXPECT_FALSE(encode(c.value).ok());
  }
}

}  // namespace
}  // namespace platform::cbor
