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
  d.set("alpha", Value());  // none removes
  EXPECT_EQ(d.keys(), (std::vector<std::string>{"zeta", "mid"}));
  EXPECT_FALSE(d.remove("alpha"));
  EXPECT_EQ(d.find("alpha"), nullptr);
}

// Past a few entries look-ups go through a hash index; it must stay right
// through growth, replacement and removal.
TEST(DictionaryTest, IndexStaysConsistentThroughGrowthAndRemoval) {
  Dictionary d;
  const int n = 1000;
  for (int i = 0; i < n; ++i) d.set("k" + std::to_string(i), i);
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
  // Shrinking below the index threshold falls back to linear search.
  for (int i = 1; i < n - 6; i += 2) d.remove("k" + std::to_string(i));
  EXPECT_EQ(d.size(), 3u);
  EXPECT_EQ(d.get("k995"), Value(995));
}

}  // namespace
}  // namespace platform
