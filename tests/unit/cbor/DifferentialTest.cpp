// The codec against libcbor, an independent implementation: what we write,
// libcbor reads as the same structure; what libcbor builds and writes (in
// several widths), we read as the same Values; and in the codec's own form
// the two produce the same bytes.
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
    switch (pick(depth < 4 ? 11 : 9)) {
      case 0:
        return Value(static_cast<std::int64_t>(rng_()) >> pick(64));
      case 1:
        return Value(rng_() | (std::uint64_t{1} << 63));
      case 2:
        return Value(realValue());
      case 3:
        return Value(pick(2) == 1);
      case 4:
        return Value(text());
      case 5: {
        Data data(pick(40));
        for (auto& b : data) b = static_cast<std::uint8_t>(rng_());
        return Value(std::move(data));
      }
      case 6:
        return Value(
            Date{static_cast<double>(static_cast<std::int64_t>(rng_() % 4'000'000'000u)) / 4});
      case 7: {
        Uuid u;
        for (auto& b : u.bytes) b = static_cast<std::uint8_t>(rng_());
        return Value(u);
      }
      case 8:
        return Value(static_cast<std::int64_t>(pick(70'000)) - 35'000);
      case 9: {
        Array array;
        for (std::size_t i = pick(7); i > 0; --i) array.append(next(depth + 1));
        return Value(std::move(array));
      }
      default: {
        Dictionary dictionary;
        for (std::size_t i = pick(10); i > 0; --i) dictionary.set(text(), next(depth + 1));
        return Value(std::move(dictionary));
      }
    }
  }

 private:
  std::size_t pick(std::size_t n) { return static_cast<std::size_t>(rng_() % n); }

  double realValue() {
    switch (pick(4)) {
      case 0:
        return std::bit_cast<double>(rng_());  // anything, NaNs included
      case 1:
        return static_cast<double>(static_cast<float>(pick(1000)) / 8.0f);
      case 2:
        return -std::ldexp(static_cast<double>(pick(1 << 20)), static_cast<int>(pick(80)) - 40);
      default:
        return pick(2) ? std::numeric_limits<double>::infinity() : -0.0;
    }
  }

  // Valid UTF-8 of one to four bytes per character, surrogates skipped.
  std::string text() {
    static constexpr std::uint32_t kRanges[][2] = {
        {0x20, 0x7e}, {0x80, 0x7ff}, {0x800, 0xd7ff}, {0xe000, 0xffff}, {0x10000, 0x10ffff}};
    constexpr std::uint8_t kLead[] = {0x00, 0xC0, 0xE0, 0xF0};
    std::string out;
    for (std::size_t n = pick(12); n > 0; --n) {
      const auto& range = kRanges[pick(std::size(kRanges))];
      std::uint32_t cp = range[0] + static_cast<std::uint32_t>(pick(range[1] - range[0] + 1));
      const int extra = cp < 0x80 ? 0 : cp < 0x800 ? 1 : cp < 0x10000 ? 2 : 3;
      out.push_back(static_cast<char>(kLead[extra] | (cp >> (6 * extra))));
      for (int i = extra - 1; i >= 0; --i)
        out.push_back(static_cast<char>(0x80 | ((cp >> (6 * i)) & 0x3F)));
    }
    return out;
  }

  std::mt19937_64 rng_;
};

constexpr int kValues = 800;

// Each value both ways: libcbor reads our bytes as the same structure, and we
// read libcbor's writing of it, in several widths, as the same Value.
TEST(CborDifferential, AgreesWithLibcborBothWays) {
  RandomValues random(20240611);
  for (int i = 0; i < kValues; ++i) {
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
      // In the codec's own form an independent writer agrees byte for byte,
      // which pins every head we write to the shortest one.
      if (widths == ItemWidths::kShortest) {
        EXPECT_EQ(toHex(*ours), toHex(theirs));
      }
    }
  }
}

}  // namespace
}  // namespace platform::cbor
