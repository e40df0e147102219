// Every kind, and structures of them, come back from encode+decode with the
// same kinds, bits and key order.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"
#include "tests/unit/cbor/oracle/IdenticalValues.h"

namespace platform::cbor {
namespace {

void expectRoundTrip(const Value& value) {
  auto bytes = encode(value);
  ASSERT_TRUE(bytes.ok()) << bytes.error().description();
  auto back = decode(*bytes);
  ASSERT_TRUE(back.ok()) << back.error().description() << " in " << toHex(*bytes);
  auto difference = oracle::firstDifference(value, *back);
  EXPECT_FALSE(difference) << *difference;
}

// Integers at their extremes and booleans round trip in HeadsTest, with
// their exact bytes.
TEST(CborRoundTrip, EveryKind) {
  const Value values[] = {
      Value(-0.0),
      Value(3.141592653589793),
      Value(1e-310),
      Value(std::numeric_limits<double>::quiet_NaN()),
      Value(""),
      Value("caf\xc3\xa9 \xe2\x82\xac \xf0\x9f\x98\x80"),
      Value(std::string("nul\0inside", 10)),
      Value(Data{0x00, 0xff, 0x80}),
      Value(Date{1712345678.25}),
      Value(Date{-86400.5}),
      Value(Uuid::generate()),
      Value(Array()),
      Value(Dictionary()),
  };
  for (const Value& v : values) {
    SCOPED_TRACE(v.description());
    expectRoundTrip(v);
  }
}

TEST(CborRoundTrip, LargeAndDeepValues) {
  expectRoundTrip(Value(std::string(100'000, 'q')));
  expectRoundTrip(Value(Data(70'000, 0x5a)));
  Array wide;
  for (int i = 0; i < 70'000; ++i) wide.append(Value(i - 35'000));
  expectRoundTrip(Value(std::move(wide)));
  Value deep(1);
  for (int i = 0; i < 64; ++i) deep = Value(Array{deep});
  expectRoundTrip(deep);
  // The encoder has no depth limit of its own: a value deeper than the
  // decoder allows still encodes, and a default decode then refuses it.
  for (int i = 0; i < 1000; ++i) deep = Value(Array{deep});
  auto bytes = encode(deep);
  ASSERT_TRUE(bytes.ok());
  EXPECT_EQ(bytes->size(), 1064u + 1u);
  EXPECT_EQ(errorCodeOf(decode(*bytes).error()), ErrorCode::kTooDeep);
}

TEST(CborRoundTrip, EncodeAppendsToWhatIsThere) {
  std::vector<std::uint8_t> out = {0x01};
  ASSERT_TRUE(encode(Value("a"), out).ok());
  ASSERT_TRUE(encode(Value(Array{Value(2)}), out).ok());
  EXPECT_EQ(toHex(out), "01 61 61 81 02");
}

}  // namespace
}  // namespace platform::cbor
