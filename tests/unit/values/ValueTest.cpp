#include <gtest/gtest.h>

#include <cmath>
#include <limits>
#include <unordered_set>

#include "platform/values/DateText.h"
#include "platform/values/Value.h"

namespace platform {
namespace {

TEST(ValueTest, NumbersCompareByValueAcrossKinds) {
  // false equals 0 and true equals 1, whatever the numeric kind.
  EXPECT_EQ(Value(false), Value(0));
  EXPECT_EQ(Value(true), Value(1));
  EXPECT_EQ(Value(true), Value(1.0));
  EXPECT_EQ(Value(true), Value(1u));
  EXPECT_NE(Value(true), Value(2));
  EXPECT_EQ(Value(2), Value(2.0));
  EXPECT_NE(Value(2), Value(2.5));
  EXPECT_EQ(Value(std::uint64_t{5}), Value(std::int64_t{5}));
  EXPECT_NE(Value(-1), Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_EQ(Value(std::numeric_limits<std::uint64_t>::max()),
            Value(std::numeric_limits<std::uint64_t>::max()));
  EXPECT_EQ(Value(9223372036854775808.0), Value(std::uint64_t{1} << 63));
  EXPECT_EQ(Value(-9223372036854775808.0), Value(std::numeric_limits<std::int64_t>::min()));
  EXPECT_EQ(Value(std::nan("")), Value(std::nan("")));
  // A number is never equal to text or to none.
  EXPECT_NE(Value(1), Value("1"));
  EXPECT_NE(Value(0), Value());
  EXPECT_EQ(Value(), Value());
}

TEST(ValueTest, EqualValuesHashAlike) {
  std::vector<std::pair<Value, Value>> equal = {
      {Value(true), Value(1.0)},
      {Value(false), Value(0u)},
      {Value(7), Value(7.0)},
      {Value(-3), Value(-3.0)},
      {Value(std::uint64_t{1} << 63), Value(9223372036854775808.0)},
      {Value(Dictionary{{"a", 1}, {"b", "x"}}), Value(Dictionary{{"b", "x"}, {"a", true}})},
      {Value(Array{1, "two"}), Value(Array{1.0, "two"})},
  };
  for (const auto& [a, b] : equal) {
    EXPECT_EQ(a, b) << a.description();
    EXPECT_EQ(a.hash(), b.hash()) << a.description();
  }
  std::unordered_set<Value, ValueHash> set{Value(1), Value(true), Value(1.0), Value("1")};
  EXPECT_EQ(set.size(), 2u);
}

TEST(ValueTest, ContainersCompareStructurally) {
  EXPECT_EQ(Value(Array{1, 2}), Value(Array{1, 2}));
  EXPECT_NE(Value(Array{1, 2}), Value(Array{2, 1}));  // arrays keep order
  EXPECT_NE(Value(Array{1}), Value(Array{1, 1}));
  Dictionary a{{"k", Array{1, Dictionary{{"n", "v"}}}}};
  Dictionary b{{"k", Array{1, Dictionary{{"n", "v"}}}}};
  EXPECT_EQ(Value(a), Value(b));
  b.set("extra", 0);
  EXPECT_NE(Value(a), Value(b));
  EXPECT_NE(Value(Data{1, 2}), Value(Data{1, 3}));
  EXPECT_NE(Value(Array{}), Value(Dictionary{}));
}

TEST(ValueTest, TypedAccessorsAnswerNoneForOtherKinds) {
  Value s("text");
  EXPECT_EQ(*s.string(), "text");
  EXPECT_EQ(s.array(), nullptr);
  EXPECT_EQ(s.dictionary(), nullptr);
  EXPECT_FALSE(s.int64());
  EXPECT_FALSE(s.boolean());
  EXPECT_FALSE(s.truth());
  EXPECT_FALSE(s.date());

  EXPECT_EQ(Value(true).int64(), 1);
  EXPECT_FALSE(Value(2.5).int64());  // reals are not integers
  EXPECT_EQ(Value(2.5).real(), 2.5);
  EXPECT_EQ(Value(0.0).truth(), false);
  EXPECT_FALSE(Value(1).boolean());  // only a boolean answers boolean()
  EXPECT_FALSE(Value(-1).uint64());
  EXPECT_FALSE(Value(std::numeric_limits<std::uint64_t>::max()).int64());
  EXPECT_TRUE(Value().isNone());
  EXPECT_EQ(Value().type(), ValueType::None);
}

TEST(ValueTest, CopiesShareStorageAndStayImmutable) {
  Dictionary d{{"a", 1}};
  Value v(d);
  Value copy = v;
  EXPECT_EQ(v.dictionary(), copy.dictionary());  // shared, not deep-copied
  d.set("b", 2);                                 // the source builder is separate
  EXPECT_EQ(v.dictionary()->size(), 1u);
}

TEST(ValueTest, DescriptionReadsLikeAPropertyList) {
  EXPECT_EQ(Value("plain").description(), "plain");
  EXPECT_EQ(Value(42).description(), "42");
  EXPECT_EQ(Value(true).description(), "true");
  EXPECT_EQ(Value(0.5).description(), "0.5");
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
  EXPECT_EQ(Uuid::parse(u->toString()), u);
  EXPECT_FALSE(Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5"));
  EXPECT_FALSE(Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5fX"));
  EXPECT_FALSE(Uuid::parse("g621e1f8-c36c-495a-93fc-0c247a3e6e5f"));
  EXPECT_NE(Uuid::generate(), Uuid::generate());
  EXPECT_TRUE(Uuid{}.isNull());
}

TEST(DateTextTest, FormatsAndParsesUtc) {
  EXPECT_EQ(formatIso8601(Date{0}), "1970-01-01T00:00:00Z");
  auto d = parseIso8601("2026-11-23T03:24:38Z");
  ASSERT_TRUE(d);
  EXPECT_EQ(formatIso8601(*d), "2026-11-23T03:24:38Z");
  EXPECT_EQ(formatIso8601(Date{-1.5}), "1969-12-31T23:59:58.5Z");
  for (double t : {1.0e9 + 0.1, 1795836278.123456789, -86400.25, 0.000001}) {
    auto back = parseIso8601(formatIso8601(Date{t}));
    ASSERT_TRUE(back) << t;
    EXPECT_EQ(back->secondsSince1970, t) << formatIso8601(Date{t});
  }
  // Out of the calendar's range: described by seconds, never undefined.
  EXPECT_EQ(formatIso8601(Date{1e300}).front(), '@');
  EXPECT_EQ(formatIso8601(Date{-1e300}).front(), '@');
  for (const char* bad : {"2026-11-23 03:24:38Z", "2026-13-01T00:00:00Z", "2026-02-30T00:00:00Z",
                          "2026-11-23T03:24:38", "2026-11-23T03:24:38+01:00", "2026-11-23T03:24:38.Z",
                          "2026-11-23T24:00:00Z", ""}) {
    EXPECT_FALSE(parseIso8601(bad)) << bad;
  }
}

}  // namespace
}  // namespace platform
