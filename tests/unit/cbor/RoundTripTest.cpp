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

TEST(CborRoundTrip, EveryKind) {
  const Value values[] = {
      Value(0),
      Value(-1),
      Value(std::numeric_limits<std::int64_t>::min()),
      Value(std::numeric_limits<std::int64_t>::max()),
      Value(std::numeric_limits<std::uint64_t>::max()),
      Value(true),
      Value(false),
      Value(0.0),
      Value(-0.0),
      Value(3.141592653589793),
      Value(1e-310),
      Value(-1e308),
      Value(std::numeric_limits<double>::infinity()),
      Value(std::numeric_limits<double>::quiet_NaN()),
      Value(""),
      Value("plain"),
      Value("caf\xc3\xa9 \xe2\x82\xac \xf0\x9f\x98\x80"),
      Value(std::string("nul\0inside", 10)),
      Value(Data{}),
      Value(Data{0x00, 0xff, 0x80}),
      Value(Date{0}),
      Value(Date{1712345678.25}),
      Value(Date{-86400.5}),
      Value(Uuid{}),
      Value(Uuid::generate()),
      Value(Array()),
      Value(Dictionary()),
  };
  for (const Value& v : values) {
    SCOPED_TRACE(v.description());
    expectRoundTrip(v);
  }
}

TEST(CborRoundTrip, NestedStructuresKeepKindsAndOrder) {
  Dictionary rules;
  rules.set("zeta", Value(Array{Value(1), Value(2.5), Value("x")}));
  rules.set("alpha", Value(Dictionary{{"deep", Value(Array{Value(Array{Value(Data{1, 2})})})}}));
  rules.set("when", Value(Date{1700000000}));
  Array forms;
  for (int i = 0; i < 12; ++i) {
    Dictionary form;
    form.set("id", Value(Uuid::generate()));
    form.set("index", Value(i));
    form.set("big", Value((std::uint64_t{1} << 63) | static_cast<std::uint64_t>(i)));
    form.set("enabled", Value(i % 2 == 0));
    forms.append(Value(std::move(form)));
  }
  Dictionary message;
  message.set("request", Value("register"));
  message.set("rules", Value(std::move(rules)));
  message.set("forms", Value(std::move(forms)));
  // More than eight keys, so the dictionary's hashed index is in play too.
  for (int i = 0; i < 20; ++i) message.set("k" + std::to_string(19 - i), Value(i));
  expectRoundTrip(Value(std::move(message)));
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
