#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <unordered_set>

#include "platform/values/DateText.h"
#include "platform/values/Value.h"

namespace platform {
namespace {

TEST(ValueTest, NumbersCompareByValueAcrossKinds) {
  EXPECT_EQ(Value(true), Value(1.0));
  EXPECT_NE(Value(2), Value(2.5));
  EXPECT_NE(Value(-1), Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_EQ(Value(9223372036854775808.0), Value(std::uint64_t{1} << 63));
  EXPECT_EQ(Value(std::nan("")), Value(std::nan("")));
  EXPECT_NE(Value(1), Value("1"));
  EXPECT_NE(Value(0), Value());
}

TEST(ValueTest, EqualValuesHashAlike) {
  std::vector<std::pair<Value, Value>> equal = {
      {Value(true), Value(1.0)},
      {Value(std::uint64_t{1} << 63), Value(9223372036854775808.0)},
      {Value(Dictionary{{"a", 1}, {"b", "x"}}), Value(Dictionary{{"b", "x"}, {"a", true}})},
  };
  for (const auto& [a, b] : equal) {
    EXPECT_EQ(a, b) << a.description();
    EXPECT_EQ(a.hash(), b.hash()) << a.description();
  }
  std::unordered_set<Value, ValueHash> set{Value(1), Value(true), Value(1.0), Value("1")};
  EXPECT_EQ(set.size(), 2u);
}

TEST(ValueTest, DescriptionReadsLikeAPropertyList) {
  EXPECT_EQ(Value().description(), "(null)");
  EXPECT_EQ(Value(Data{0xde, 0xad}).description(), "{length = 2, bytes = 0xdead}");
  Dictionary d{{"name", "a b"}, {"list", Array{1, "x"}}, {"empty", Dictionary{}}};
  EXPECT_EQ(Value(d).description(),
            "{\n    name = \"a b\";\n    list = (\n        1,\n        x\n    );\n    empty = {};\n}");
  EXPECT_EQ(Value(Array{"quote\"d"}).description(), "(\n    \"quote\\\"d\"\n)");
}

TEST(UuidTest, TextFormIsUpperCaseAndParsesEitherCase) {
  auto u = Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5f");
  ASSERT_TRUE(u);
  EXPECT_EQ(u->toString(), "E621E1F8-C36C-495A-93FC-0C247A3E6E5F");
  EXPECT_FALSE(Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5fX"));
  EXPECT_FALSE(Uuid::parse("g621e1f8-c36c-495a-93fc-0c247a3e6e5f"));
}

TEST(DateTextTest, FormatsAndParsesUtc) {
  EXPECT_EQ(formatIso8601(Date{-1.5}), "1969-12-31T23:59:58.5Z");
  for (double t : {1795836278.123456789, -86400.25}) {
    auto back = parseIso8601(formatIso8601(Date{t}));
    ASSERT_TRUE(back) << t;
    EXPECT_EQ(back->secondsSince1970, t) << formatIso8601(Date{t});
  }
  // Out of the calendar's range: described by seconds, never undefined.
  EXPECT_EQ(formatIso8601(Date{1e300}).front(), '@');
  for (const char* bad : {"2026-02-30T00:00:00Z", "2026-11-23T03:24:38+01:00", "2026-11-23T03:24:38.Z", ""}) {
    EXPECT_FALSE(parseIso8601(bad)) << bad;
  }
}

}  // namespace
}  // namespace platform
