// Exact bytes: shortest heads at every width boundary, the fixed forms of
// reals, dates and UUIDs, and the float widths and longer heads a reader
// must accept.
#include <gtest/gtest.h>

#include <cmath>
#include <cstdint>
#include <limits>
#include <string>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"

namespace platform::cbor {
namespace {

constexpr std::int64_t kMin = std::numeric_limits<std::int64_t>::min();
constexpr std::int64_t kMax = std::numeric_limits<std::int64_t>::max();
constexpr std::uint64_t kUMax = std::numeric_limits<std::uint64_t>::max();

struct IntegerCase {
  Value value;
  const char* hex;
  ValueType decodedAs;
};

TEST(CborHeads, IntegersTakeTheShortestHeadAtEveryBoundary) {
  const IntegerCase cases[] = {
      {Value(0), "00", ValueType::Integer},
      {Value(23), "17", ValueType::Integer},
      {Value(24), "18 18", ValueType::Integer},
      {Value(255), "18 ff", ValueType::Integer},
      {Value(256), "19 01 00", ValueType::Integer},
      {Value(65535), "19 ff ff", ValueType::Integer},
      {Value(65536), "1a 00 01 00 00", ValueType::Integer},
      {Value(4294967295ll), "1a ff ff ff ff", ValueType::Integer},
      {Value(4294967296ll), "1b 00 00 00 01 00 00 00 00", ValueType::Integer},
      {Value(kMax), "1b 7f ff ff ff ff ff ff ff", ValueType::Integer},
      {Value(std::uint64_t{kMax} + 1), "1b 80 00 00 00 00 00 00 00", ValueType::Unsigned},
      {Value(kUMax), "1b ff ff ff ff ff ff ff ff", ValueType::Unsigned},
      {Value(std::uint64_t{7}), "07", ValueType::Integer},
      {Value(-1), "20", ValueType::Integer},
      {Value(-24), "37", ValueType::Integer},
      {Value(-25), "38 18", ValueType::Integer},
      {Value(-256), "38 ff", ValueType::Integer},
      {Value(-257), "39 01 00", ValueType::Integer},
      {Value(-65536), "39 ff ff", ValueType::Integer},
      {Value(-65537), "3a 00 01 00 00", ValueType::Integer},
      {Value(-4294967296ll), "3a ff ff ff ff", ValueType::Integer},
      {Value(-4294967297ll), "3b 00 00 00 01 00 00 00 00", ValueType::Integer},
      {Value(kMin), "3b 7f ff ff ff ff ff ff ff", ValueType::Integer},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.hex);
    auto bytes = encode(c.value);
    ASSERT_TRUE(bytes.ok());
    EXPECT_EQ(toHex(*bytes), c.hex);
    auto back = decode(*bytes);
    ASSERT_TRUE(back.ok()) << back.error().description();
    EXPECT_EQ(back->type(), c.decodedAs);
    EXPECT_EQ(*back, c.value);
  }
}

TEST(CborHeads, LengthsTakeTheShortestHeadAtEveryBoundary) {
  const struct {
    std::size_t length;
    const char* textHead;
  } cases[] = {{0, "60"},
               {23, "77"},
               {24, "78 18"},
               {255, "78 ff"},
               {256, "79 01 00"},
               {65535, "79 ff ff"},
               {65536, "7a 00 01 00 00"}};
  for (const auto& c : cases) {
    SCOPED_TRACE(c.length);
    const std::string head = c.textHead;
    const std::size_t headBytes = (head.size() + 1) / 3;
    auto text = encode(Value(std::string(c.length, 'x')));
    auto data = encode(Value(Data(c.length, 0xAB)));
    auto array = encode(Value(Array(std::vector<Value>(c.length, Value(1)))));
    ASSERT_TRUE(text.ok() && data.ok() && array.ok());
    ASSERT_EQ(text->size(), headBytes + c.length);
    EXPECT_EQ(toHex({text->begin(), text->begin() + headBytes}), head);
    // Same argument, other major types: 2 (bytes) and 4 (array) instead of 3.
    std::string dataHead = head, arrayHead = head;
    dataHead[0] = static_cast<char>(head[0] - 2);
    arrayHead[0] = static_cast<char>(head[0] + 2);
    EXPECT_EQ(toHex({data->begin(), data->begin() + headBytes}), dataHead);
    EXPECT_EQ(toHex({array->begin(), array->begin() + headBytes}), arrayHead);
    auto back = decode(*array);
    ASSERT_TRUE(back.ok());
    EXPECT_EQ(back->array()->size(), c.length);
  }
}

TEST(CborHeads, FixedFormsOfTheOtherKinds) {
  Dictionary ordered;
  ordered.set("b", Value(1));
  ordered.set("a", Value(2));
  const std::pair<Value, const char*> cases[] = {
      {Value(false), "f4"},
      {Value(true), "f5"},
      {Value(1.1), "fb 3f f1 99 99 99 99 99 9a"},
      {Value(1.0), "fb 3f f0 00 00 00 00 00 00"},  // always 64-bit, even when exact in 16
      {Value(Date{1.5}), "c1 fb 3f f8 00 00 00 00 00 00"},
      {Value(*Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F")),
       "d8 25 50 e6 21 e1 f8 c3 6c 49 5a 93 fc 0c 24 7a 3e 6e 5f"},
      {Value(Array()), "80"},
      {Value(Dictionary()), "a0"},
      {Value(std::move(ordered)), "a2 61 62 01 61 61 02"},  // insertion order kept
      {Value("\xc3\xa9"), "62 c3 a9"},
  };
  for (const auto& [value, hex] : cases) {
    SCOPED_TRACE(hex);
    auto bytes = encode(value);
    ASSERT_TRUE(bytes.ok());
    EXPECT_EQ(toHex(*bytes), hex);
  }
}

TEST(CborHeads, ReadsFloatsOfEveryWidthExactly) {
  const std::pair<const char*, double> cases[] = {
      {"f9 3c 00", 1.0},
      {"f9 c4 00", -4.0},
      {"f9 7b ff", 65504.0},                  // largest half
      {"f9 04 00", std::ldexp(1.0, -14)},     // smallest normal half
      {"f9 03 ff", std::ldexp(1023.0, -24)},  // largest subnormal half
      {"f9 00 01", std::ldexp(1.0, -24)},     // smallest subnormal half
      {"f9 7c 00", std::numeric_limits<double>::infinity()},
      {"f9 fc 00", -std::numeric_limits<double>::infinity()},
      {"fa 47 c3 50 00", 100000.0},
      {"fa 7f 7f ff ff", static_cast<double>(std::numeric_limits<float>::max())},
      {"fa 00 00 00 01", static_cast<double>(std::numeric_limits<float>::denorm_min())},
      {"fb 3f f1 99 99 99 99 99 9a", 1.1},
      {"fb 7f ef ff ff ff ff ff ff", std::numeric_limits<double>::max()},
  };
  for (const auto& [hex, expected] : cases) {
    SCOPED_TRACE(hex);
    auto v = decodeHex(hex);
    ASSERT_TRUE(v.ok()) << v.error().description();
    ASSERT_EQ(v->type(), ValueType::Real);
    EXPECT_EQ(*v->real(), expected);
  }
  auto negativeZero = decodeHex("f9 80 00");
  ASSERT_TRUE(negativeZero.ok());
  EXPECT_TRUE(std::signbit(*negativeZero->real()));
  for (const char* nan : {"f9 7e 00", "fa 7f c0 00 00", "fb 7f f8 00 00 00 00 00 00"}) {
    auto v = decodeHex(nan);
    ASSERT_TRUE(v.ok());
    EXPECT_TRUE(std::isnan(*v->real())) << nan;
  }
}

TEST(CborHeads, AcceptsLongerHeadsAndEveryDateForm) {
  const std::pair<const char*, Value> cases[] = {
      {"18 05", Value(5)},
      {"19 00 05", Value(5)},
      {"1b 00 00 00 00 00 00 00 05", Value(5)},
      {"38 00", Value(-1)},
      {"58 01 ff", Value(Data{0xff})},
      {"79 00 01 61", Value("a")},
      {"9a 00 00 00 01 01", Value(Array{Value(1)})},
      {"b8 01 61 61 01", Value(Dictionary{{"a", Value(1)}})},
      {"d8 01 00", Value(Date{0})},
      {"c1 1a 5f 5e 10 00", Value(Date{1600000000})},
      {"c1 39 01 00", Value(Date{-257})},
      {"c1 f9 3e 00", Value(Date{1.5})},
      {"c1 fa 3f c0 00 00", Value(Date{1.5})},
      {"d9 00 25 50 00 01 02 03 04 05 06 07 08 09 0a 0b 0c 0d 0e 0f",
       Value(Uuid{{0, 1, 2, 3, 4, 5, 6, 7, 8, 9, 10, 11, 12, 13, 14, 15}})},
  };
  for (const auto& [hex, expected] : cases) {
    SCOPED_TRACE(hex);
    auto v = decodeHex(hex);
    ASSERT_TRUE(v.ok()) << v.error().description();
    EXPECT_EQ(v->type(), expected.type());
    EXPECT_EQ(*v, expected);
  }
}

}  // namespace
}  // namespace platform::cbor
