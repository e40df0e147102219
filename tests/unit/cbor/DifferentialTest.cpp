// The codec against libcbor, an independent implementation, both ways and
// byte for byte; then exact bytes: shortest heads at the width boundaries,
// the fixed forms of reals, dates and UUIDs, and longer forms a reader takes.
#include <gtest/gtest.h>

#include <bit>
#include <cmath>
#include <limits>
#include <random>

#include "platform/cbor/Cbor.h"
#include "tests/unit/cbor/CborTestBytes.h"
#include "tests/unit/cbor/oracle/IdenticalValues.h"
#include "tests/unit/cbor/oracle/LibcborOracle.h"

namespace platform::cbor {
namespace {

using oracle::ItemWidths;

// Seeded, so every run checks the same values and failures reproduce.
class RandomValues {
 public:
  explicit RandomValues(std::uint64_t seed) : rng_(seed) {}

  Value next(int depth = 0) {
    const std::size_t kind = pick(depth < 4 ? 10 : 8);
    if (kind == 0) return Value(static_cast<std::int64_t>(rng_()) >> pick(64));
    if (kind == 1) return Value(rng_() | (std::uint64_t{1} << 63));
    if (kind == 2) return Value(pick(2) ? std::bit_cast<double>(rng_()) : -0.0);  // NaNs too
    if (kind == 3) return Value(pick(2) == 1);
    if (kind == 4) return Value(text());
    if (kind == 5)
      return Value(Data(pick(300), static_cast<std::uint8_t>(rng_())));  // 2-byte lengths
    if (kind == 6) return Value(Date{static_cast<double>(rng_() % 4'000'000'000u) / 4});
    if (kind == 7) return Value(Uuid::generate());
    const bool list = pick(2) == 1;
    Array array;
    Dictionary dictionary;
    for (std::size_t i = pick(8); i > 0; --i) {
      if (list) array.append(next(depth + 1));
      if (!list) dictionary.set(text(), next(depth + 1));
    }
    return list ? Value(std::move(array)) : Value(std::move(dictionary));
  }

 private:
  std::size_t pick(std::size_t n) { return static_cast<std::size_t>(rng_() % n); }

  // Valid UTF-8 of one to four bytes per character.
  std::string text() {
    static const std::string kChars[] = {"a", std::string(1, '\0'), "\xc3\xa9", "\xe2\x82\xac",
                                         "\xf0\x9f\x98\x80"};
    std::string out;
    for (std::size_t n = pick(12); n > 0; --n) out += kChars[pick(std::size(kChars))];
    return out;
  }

  std::mt19937_64 rng_;
};

TEST(CborDifferential, AgreesWithLibcborBothWays) {
  RandomValues random(20240611);
  for (int i = 0; i < 800; ++i) {
    Value value = random.next();
    auto ours = encode(value);
    ASSERT_TRUE(ours.ok()) << ours.error().description();
    auto loaded = oracle::libcborLoad(*ours);
    ASSERT_TRUE(loaded) << "libcbor refused " << toHex(*ours);
    auto mismatch = oracle::itemMismatch(*loaded, value);
    EXPECT_FALSE(mismatch) << *mismatch << " in " << toHex(*ours);
    for (ItemWidths widths : {ItemWidths::kShortest, ItemWidths::kNarrowest, ItemWidths::kWidest}) {
      auto item = oracle::itemFromValue(value, widths);
      ASSERT_TRUE(item);
      std::vector<std::uint8_t> theirs = oracle::libcborSerialize(*item);
      auto back = decode(theirs);
      ASSERT_TRUE(back.ok()) << back.error().description() << " in " << toHex(theirs);
      auto difference = oracle::firstDifference(value, *back);
      EXPECT_FALSE(difference) << *difference << " in " << toHex(theirs);
      // In the codec's own form an independent writer agrees byte for byte.
      if (widths == ItemWidths::kShortest) {
        EXPECT_EQ(toHex(*ours), toHex(theirs));
      }
    }
  }
}

// Each value is written as exactly these bytes and reads back identical.
TEST(CborHeads, WritesTheShortestHeadAndFixedForms) {
  Dictionary ordered;
  ordered.set("b", Value(1));
  ordered.set("a", Value(2));
  const std::pair<Value, const char*> cases[] = {
      {Value(23), "17"},
      {Value(24), "18 18"},
      {Value(65536), "1a 00 01 00 00"},
      {Value(std::numeric_limits<std::uint64_t>::max()), "1b ff ff ff ff ff ff ff ff"},
      {Value(-25), "38 18"},
      {Value(std::numeric_limits<std::int64_t>::min()), "3b 7f ff ff ff ff ff ff ff"},
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

// Forms the writer never produces but a reader must take.
TEST(CborHeads, ReadsEveryAcceptedForm) {
  const std::pair<const char*, Value> cases[] = {
      {"f9 c4 00", Value(-4.0)},
      {"f9 00 01", Value(std::ldexp(1.0, -24))},  // smallest subnormal half
      {"f9 7e 00", Value(std::numeric_limits<double>::quiet_NaN())},
      {"fa 47 c3 50 00", Value(100000.0)},
      {"1b 00 00 00 00 00 00 00 05", Value(5)},
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

// The encoder has no depth limit of its own: a value deeper than the decoder
// allows still encodes, and a default decode then refuses it. Encoding
// appends to what is in the buffer.
TEST(CborHeads, DeepValuesAndAppending) {
  Value deep(1);
  for (int i = 0; i < 1064; ++i) deep = Value(Array{deep});
  auto bytes = encode(deep);
  ASSERT_TRUE(bytes.ok());
  EXPECT_EQ(bytes->size(), 1064u + 1u);
  EXPECT_EQ(errorCodeOf(decode(*bytes).error()), ErrorCode::kTooDeep);
  std::vector<std::uint8_t> out = {0x01};
  ASSERT_TRUE(encode(Value("a"), out).ok());
  ASSERT_TRUE(encode(Value(Array{Value(2)}), out).ok());
  EXPECT_EQ(toHex(out), "01 61 61 81 02");
}

}  // namespace
}  // namespace platform::cbor
