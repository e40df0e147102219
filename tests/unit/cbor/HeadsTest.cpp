// Exact bytes: shortest heads at every width boundary, the fixed forms of
// reals, dates and UUIDs, and the float widths and longer heads a reader
// must accept. Lengths share the integer heads; the differential and large
// round trips cover them.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"
#include "tests/unit/cbor/oracle/IdenticalValues.h"

namespace platform::cbor {
namespace {

constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();

// Each value is written as exactly these bytes and reads back identical.
TEST(CborHeads, WritesTheShortestHeadAndFixedForms) {
  Dictionary ordered;
  ordered.set("b", Value(1));
  ordered.set("a", Value(2));
  const std::pair<Value, const char*> cases[] = {
      {Value(0), "00"},
      {Value(23), "17"},
      {Value(24), "18 18"},
      {Value(255), "18 ff"},
      {Value(256), "19 01 00"},
      {Value(65535), "19 ff ff"},
      {Value(65536), "1a 00 01 00 00"},
      {Value(4294967295ll), "1a ff ff ff ff"},
      {Value(4294967296ll), "1b 00 00 00 01 00 00 00 00"},
      {Value(kMax), "1b 7f ff ff ff ff ff ff ff"},
      {Value(std::uint64_t{kMax} + 1), "1b 80 00 00 00 00 00 00 00"},
      {Value(std::numeric_limits<std::uint64_t>::max()), "1b ff ff ff ff ff ff ff ff"},
      {Value(-1), "20"},
      {Value(-24), "37"},
      {Value(-25), "38 18"},
      {Value(-257), "39 01 00"},
      {Value(std::numeric_limits<std::int64_t>::min()), "3b 7f ff ff ff ff ff ff ff"},
      {Value(false), "f4"},
      {Value(true), "f5"},
      {Value(1.1), "fb 3f f1 99 99 99 99 99 9a"},
      {Value(1.0), "fb 3f f0 00 00 00 00 00 00"},  // always 64-bit, even when exact in 16
      {Value(Date{1.5}), "c1 fb 3f f8 00 00 00 00 00 00"},
      {Value(*Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F")),
       "d8 25 50 e6 21 e1 f8 c3 6c 49 5a 93 fc 0c 24 7a 3e 6e 5f"},
      {Value(std::move(ordered)), "a2 61 62 01 61 61 02"},  // insertion order kept
      {Value("\xc3\xa9"), "62 c3 a9"},                      // length in bytes
  };
  for (const auto& [value, hex] : cases) {
    SCOPED_TRACE(hex);
    auto bytes = encode(value);
    ASSERT_TRUE(bytes.ok());
    EXPECT_EQ(toHex(*bytes), hex);
    auto back = decode(*bytes);
    ASSERT_TRUE(back.ok()) << back.error().description();
    auto difference = oracle::firstDifference(value, *back);
    EXPECT_FALSE(difference) << *difference;
  }
  EXPECT_EQ(toHex(*encode(Value(std::uint64_t{7}))), "07");  // small Unsigned, shortest too
}

// Forms the writer never produces but a reader must take: narrow floats,
// longer heads, and dates on integers and narrow floats.
TEST(CborHeads, ReadsEveryAcceptedForm) {
  const std::pair<const char*, Value> cases[] = {
      {"f9 3c 00", Value(1.0)},
      {"f9 c4 00", Value(-4.0)},
      {"f9 80 00", Value(-0.0)},
      {"f9 7b ff", Value(65504.0)},               // largest half
      {"f9 04 00", Value(std::ldexp(1.0, -14))},  // smallest normal half
      {"f9 03 ff", Value(std::ldexp(1023.0, -24))},
      {"f9 00 01", Value(std::ldexp(1.0, -24))},  // smallest subnormal half
      {"f9 7c 00", Value(std::numeric_limits<double>::infinity())},
      {"f9 7e 00", Value(std::numeric_limits<double>::quiet_NaN())},
      {"fa 47 c3 50 00", Value(100000.0)},
      {"fa 00 00 00 01", Value(static_cast<double>(std::numeric_limits<float>::denorm_min()))},
      {"fa 7f c0 00 00", Value(std::numeric_limits<double>::quiet_NaN())},
      {"18 05", Value(5)},
      {"1b 00 00 00 00 00 00 00 05", Value(5)},
      {"38 00", Value(-1)},
      {"79 00 01 61", Value("a")},
      {"9a 00 00 00 01 01", Value(Array{Value(1)})},
      {"b8 01 61 61 01", Value(Dictionary{{"a", Value(1)}})},
      {"d8 01 00", Value(Date{0})},
      {"c1 1a 5f 5e 10 00", Value(Date{1600000000})},
      {"c1 39 01 00", Value(Date{-257})},
      {"c1 f9 3e 00", Value(Date{1.5})},
      {"d9 00 25 50 00 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d 0e 0f",
       Value(Uuid{{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15}})},
  };
  for (const auto& [hex, expected] : cases) {
    SCOPED_TRACE(hex);
    auto v = decodeHex(hex);
    ASSERT_TRUE(v.ok()) << v.error().description();
    auto difference = oracle::firstDifference(expected, *v);
    EXPECT_FALSE(difference) << *difference;
  }
}

}  // namespace
}  // namespace platform::cbor
