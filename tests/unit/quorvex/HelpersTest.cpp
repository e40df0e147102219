#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "Quorvex/QVVersionComparison.h"
#include "Quorvex/SmallDictionaryChanges.h"

namespace {

using platform::Dictionary;
using platform::Value;

TEST(VersionComparisonTest, DigitRunsCompareByValue) {
  struct Case {
    const char* a;
    const char* b;
    QVOrdering want;
  } cases[] = {
      {"1.10", "1.9", QVOrdering::Descending},
      {"1.0", "1.0.1", QVOrdering::Ascending},  // a prefix orders first
      {"1.0A", "1.0a", QVOrdering::Ascending},  // case counts: 'A' < 'a'
      {"01", "1", QVOrdering::Same},            // leading zeros do not count
      {"1.002", "1.1", QVOrdering::Descending},
      {"", "0", QVOrdering::Ascending},
      {"1a", "1.", QVOrdering::Descending},  // 'a' (0x61) > '.' (0x2e)
      // Runs far beyond 64 bits still compare by value.
      {"99999999999999999999999999", "100000000000000000000000000", QVOrdering::Ascending},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(compareVersionString(c.a, c.b), c.want) << c.a << " vs " << c.b;
    // The comparison is antisymmetric.
    EXPECT_EQ(static_cast<int>(compareVersionString(c.b, c.a)), -static_cast<int>(c.want))
        << c.b << " vs " << c.a;
  }
}

TEST(DictionaryChangingTest, ChangesACopyOnly) {
  const Dictionary original{{"election", 1}, {"extension", Dictionary{{"k", "v"}}}};
  Dictionary changed = dictionaryChangingTo(original, "election", Value(0));
  EXPECT_EQ(changed.get("election"), Value(0));
  EXPECT_EQ(original.get("election"), Value(1));
  EXPECT_EQ(changed.keys(), original.keys());  // position kept

  Dictionary removed = dictionaryChangingTo(original, "extension", Value());
  EXPECT_FALSE(removed.contains("extension"));
  EXPECT_TRUE(original.contains("extension"));

  Dictionary absent = dictionaryChangingTo(original, "missing", Value());
  EXPECT_EQ(absent, original);

  Dictionary added = dictionaryChangingTo(Dictionary{}, "election", Value(1));
  EXPECT_EQ(added, (Dictionary{{"election", 1}}));
}

}  // namespace
