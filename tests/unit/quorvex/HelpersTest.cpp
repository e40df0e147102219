#include <gtest/gtest.h>

#include <map>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "Quorvex/QVVersionComparison.h"
#include "Quorvex/SmallDictionaryChanges.h"
#include "Quorvex/XOArrayBlockComprehension.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

TEST(VersionComparisonTest, DigitRunsCompareByValue) {
  struct Case {
    const char* a;
    const char* b;
    QVOrdering want;
  } cases[] = {
      {"1.10", "1.9", QVOrdering::Descending},
      {"2", "10", QVOrdering::Ascending},
      {"1.0", "1.0", QVOrdering::Same},
      {"1.0", "1.0.1", QVOrdering::Ascending},  // a prefix orders first
      {"1.0.1", "1.0", QVOrdering::Descending},
      {"1.0b", "1.0a", QVOrdering::Descending},
      {"1.0A", "1.0a", QVOrdering::Ascending},  // case counts: 'A' < 'a'
      {"01", "1", QVOrdering::Same},            // leading zeros do not count
      {"1.01", "1.1", QVOrdering::Same},
      {"1.002", "1.1", QVOrdering::Descending},
      {"0", "00", QVOrdering::Same},
      {"", "", QVOrdering::Same},
      {"", "0", QVOrdering::Ascending},
      {"1a", "1.", QVOrdering::Descending},  // 'a' (0x61) > '.' (0x2e)
      {"1.9a", "1.10", QVOrdering::Ascending},
      // Runs far beyond 64 bits still compare by value.
      {"99999999999999999999999999", "100000000000000000000000000", QVOrdering::Ascending},
      {"3.99999999999999999999", "3.100000000000000000000", QVOrdering::Ascending},
  };
  for (const auto& c : cases) {
    EXPECT_EQ(compareVersionString(c.a, c.b), c.want) << c.a << " vs " << c.b;
    // The comparison is antisymmetric.
    EXPECT_EQ(static_cast<int>(compareVersionString(c.b, c.a)), -static_cast<int>(c.want))
        << c.b << " vs " << c.a;
  }
}

TEST(VersionComparisonTest, SortsAReleaseHistoryInOrder) {
  std::vector<std::string> versions = {"1.10", "1.2", "1.2.1", "1.9", "10.0", "2.0b1", "2.0"};
  std::sort(versions.begin(), versions.end(), [](const std::string& a, const std::string& b) {
    return compareVersionString(a, b) == QVOrdering::Ascending;
  });
  EXPECT_EQ(versions,
            (std::vector<std::string>{"1.2", "1.2.1", "1.9", "1.10", "2.0", "2.0b1", "10.0"}));
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

TEST(ArrayComprehensionTest, KeepsOrderAndDropsNone) {
  std::vector<int> input = {1, 2, 3, 4, 5};
  Array odds = arrayWithValuesInBlock(input, [](int i) { return i % 2 ? Value(i * 10) : Value(); });
  EXPECT_EQ(odds, (Array{10, 30, 50}));

  Array none = arrayWithValuesInBlock(input, [](int) { return Value(); });
  EXPECT_TRUE(none.empty());

  std::vector<std::string> names = arrayWithValuesInBlock(
      input, [](int i) -> std::optional<std::string> {
        if (i > 3) return std::nullopt;
        return "n" + std::to_string(i);
      });
  EXPECT_EQ(names, (std::vector<std::string>{"n1", "n2", "n3"}));

  auto shared = arrayWithValuesInBlock(input, [](int i) {
    return i == 2 ? nullptr : std::make_shared<int>(i);
  });
  ASSERT_EQ(shared.size(), 4u);
  EXPECT_EQ(*shared[1], 3);

  std::map<std::string, int> m = {{"a", 1}, {"b", 2}};
  Array keys = arrayWithValuesInBlock(m, [](const auto& kv) { return Value(kv.first); });
  EXPECT_EQ(keys, (Array{"a", "b"}));
}

}  // namespace
