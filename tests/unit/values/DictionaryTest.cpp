#include <gtest/gtest.h>

#include <string>

#include "platform/values/Value.h"

namespace platform {
namespace {

TEST(DictionaryTest, KeepsInsertionOrderAndReplacesInPlace) {
  Dictionary d;
  d.set("zeta", 1);
  d.set("alpha", 2);
  d.set("mid", 3);
  d.set("zeta", 10);  // replacing keeps the position
  EXPECT_EQ(d.keys(), (std::vector<std::string>{"zeta", "alpha", "mid"}));
  EXPECT_EQ(d.get("zeta"), Value(10));
  d.set("alpha", Value());  // none removes
  EXPECT_EQ(d.keys(), (std::vector<std::string>{"zeta", "mid"}));
  EXPECT_FALSE(d.remove("alpha"));
  EXPECT_TRUE(d.get("alpha").isNone());
  EXPECT_EQ(d.find("alpha"), nullptr);
}

// Past a few entries look-ups go through a hash index; it must stay right
// through growth, replacement and removal.
TEST(DictionaryTest, IndexStaysConsistentThroughGrowthAndRemoval) {
  Dictionary d;
  const int n = 1000;
  for (int i = 0; i < n; ++i) d.set("k" + std::to_string(i), i);
  ASSERT_EQ(d.size(), static_cast<std::size_t>(n));
  for (int i = 0; i < n; i += 2) EXPECT_TRUE(d.remove("k" + std::to_string(i)));
  for (int i = 0; i < n; ++i) {
    const Value* v = d.find("k" + std::to_string(i));
    if (i % 2 == 0) {
      EXPECT_EQ(v, nullptr) << i;
    } else {
      ASSERT_NE(v, nullptr) << i;
      EXPECT_EQ(*v, Value(i));
    }
  }
  for (int i = 1; i < n; i += 2) d.set("k" + std::to_string(i), -i);
  EXPECT_EQ(d.size(), static_cast<std::size_t>(n / 2));
  EXPECT_EQ(d.entries().front().first, "k1");
  EXPECT_EQ(d.get("k999"), Value(-999));
  // Shrinking below the index threshold falls back to linear search.
  for (int i = 1; i < n - 6; i += 2) d.remove("k" + std::to_string(i));
  EXPECT_EQ(d.size(), 3u);
  EXPECT_EQ(d.get("k995"), Value(-995));
}

TEST(DictionaryTest, EqualityIgnoresOrderButNotContent) {
  Dictionary a{{"x", 1}, {"y", 2}};
  Dictionary b{{"y", 2}, {"x", 1}};
  EXPECT_EQ(a, b);
  b.set("x", 3);
  EXPECT_NE(a, b);
  Dictionary c{{"x", 1}};
  EXPECT_NE(a, c);
  EXPECT_NE(c, a);
}

TEST(DictionaryTest, KeysMayHoldAnyText) {
  Dictionary d;
  d.set("", 1);
  d.set(std::string("nul\0key", 7), 2);
  d.set("ключ", 3);
  EXPECT_EQ(d.get(""), Value(1));
  EXPECT_EQ(d.get(std::string("nul\0key", 7)), Value(2));
  EXPECT_TRUE(d.get("nul").isNone());
  EXPECT_EQ(d.get("ключ"), Value(3));
}

}  // namespace
}  // namespace platform
