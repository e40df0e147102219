// Values put into a message already encoded: the peer must read the very
// bytes the plain value would have given, whatever the sizes of the heads,
// and a failure must leave the message buffer as it was.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/cbor/Cbor.h"
#include "platform/cbor/CborError.h"
#include "platform/cbor/EncodedValue.h"

namespace platform::cbor {
namespace {

Value sample(int n) {
  return Value(Dictionary{{"n", Value(n)},
                          {"uuid", Value(Uuid::generate())},
                          {"date", Value(Date{1795411478.25})},
                          {"text", Value("é" + std::to_string(n))},
                          {"list", Value(Array{Value(-1), Value(2.5), Value(Data{1, 2})})}});
}

EncodedValue encoded(const Value& value) {
  Result<EncodedValue> e = EncodedValue::encode(value);
  EXPECT_TRUE(e.ok());
  return std::move(e).value();
}

TEST(CborEncodedValues, SplicedEntriesGiveTheBytesOfThePlainValue) {
  // Sizes on both sides of every head-length step: 23 fits the first byte,
  // 24 needs one more, 256 two more.
  for (const std::size_t plainCount : {0u, 1u, 22u, 23u, 255u}) {
    SCOPED_TRACE(plainCount);
    Dictionary plain;
    for (std::size_t i = 0; i < plainCount; ++i) plain.set("k" + std::to_string(i), Value(i));
    const Value big = sample(7);
    const std::vector<EncodedEntry> spliced = {{"matches", encoded(big)}};

    std::vector<std::uint8_t> out = {0xAA};
    ASSERT_TRUE(encodeMap(plain, spliced, out).ok());
    Dictionary whole = plain;
    whole.set("matches", big);
    std::vector<std::uint8_t> expected = {0xAA};
    ASSERT_TRUE(encode(Value(whole), expected).ok());
    EXPECT_EQ(out, expected);
  }
}

TEST(CborEncodedValues, ArraysOfEncodedElementsAreTheArraysOfTheElements) {
  for (const int count : {0, 1, 23, 24, 300}) {
    SCOPED_TRACE(count);
    Array plain;
    std::vector<EncodedValue> elements;
    for (int i = 0; i < count; ++i) {
      plain.append(sample(i));
      elements.push_back(encoded(plain[plain.size() - 1]));
    }
    const EncodedValue joined = EncodedValue::array(elements);
    const Result<std::vector<std::uint8_t>> expected = encode(Value(plain));
    ASSERT_TRUE(expected.ok());
    EXPECT_TRUE(std::equal(joined.bytes().begin(), joined.bytes().end(), expected->begin(),
                           expected->end()));
    EXPECT_EQ(joined.decode(), Value(plain));
  }
}

TEST(CborEncodedValues, FailuresNameTheFaultAndLeaveTheBufferAlone) {
  EXPECT_FALSE(EncodedValue::encode(Value()).ok());
  const Result<EncodedValue> badText = EncodedValue::encode(Value(Array{Value("\xc0")}));
  ASSERT_FALSE(badText.ok());
  EXPECT_EQ(errorCodeOf(badText.error()), ErrorCode::kInvalidUtf8);

  const std::vector<std::uint8_t> before = {0x01, 0x02};
  std::vector<std::uint8_t> out = before;
  const std::vector<EncodedEntry> good = {{"matches", encoded(sample(1))}};
  // A bad plain value, after the head and some entries were written.
  Status status = encodeMap(Dictionary{{"a", Value(1)}, {"b", Value(Array{Value()})}}, good, out);
  ASSERT_FALSE(status.ok());
  EXPECT_EQ(errorCodeOf(status.error()), ErrorCode::kUnencodableValue);
  EXPECT_NE(status.error().description().find("(at /b/0)"), std::string::npos)
      << status.error().description();
  EXPECT_EQ(out, before);
  // A bad key among the encoded entries, after every plain entry.
  const std::vector<EncodedEntry> badKey = {{"ok", encoded(Value(1))},
                                            {std::string("k\xff"), encoded(Value(2))}};
  status = encodeMap(Dictionary{{"a", Value(1)}}, badKey, out);
  ASSERT_FALSE(status.ok());
  EXPECT_EQ(errorCodeOf(status.error()), ErrorCode::kInvalidUtf8);
  EXPECT_NE(status.error().description().find("(at /k\xff)"), std::string::npos);
  EXPECT_EQ(out, before);
}

}  // namespace
}  // namespace platform::cbor
