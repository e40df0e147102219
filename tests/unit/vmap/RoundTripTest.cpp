// Whatever is written reads back as the same value, kind for kind, in both
// forms: the property every user of vmap documents relies on.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/vmap/Writer.h"
#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

using testing::identical;
using testing::readText;

Value everyKind() {
  Data bytes;
  for (int i = 0; i < 256; ++i) bytes.push_back(static_cast<std::uint8_t>(i));
  Dictionary d;
  d.set("unicode", "Gr\u00fc\u00dfe \u2014 \u65e5\u672c\u8a9e \U0001F600");
  d.set("markup", "a < b && c > d ]]> \"q\" 'a' &amp;");
  d.set("line ends", "one\r\ntwo\rthree\nfour\tfive  ");
  d.set("spaces only", "  \n ");
  d.set("", "the empty key");
  d.set("empty string", "");
  d.set("int max", std::numeric_limits<std::int64_t>::max());
  d.set("int min", std::numeric_limits<std::int64_t>::min());
  d.set("uint max", std::numeric_limits<std::uint64_t>::max());
  d.set("uint past int", std::uint64_t{1} << 63);
  d.set("pi", 3.141592653589793);
  d.set("subnormal", 5e-324);
  d.set("integral real", 2.0);
  d.set("true", true);
  d.set("false", false);
  d.set("fractional date", Date{1795404278.125});
  d.set("tiny fraction", Date{1795404278.0 + std::ldexp(1.0, -22)});
  d.set("before 1970", Date{-86400.5});
  d.set("year 0", Date{-62167219200.0});
  d.set("year 9999", Date{253402300799.75});
  d.set("data", bytes);  // every byte, and base64 with two '=' of padding
  d.set("padded once", Data{'f', 'o'});
  d.set("empty data", Data{});
  d.set("uuid", *Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F"));
  d.set("empty array", Array{});
  d.set("empty dict", Dictionary{});
  d.set("nested", Array{Dictionary{{"k", Array{1, "two", 3.5, Array{}}}}, Array{Dictionary{}}});
  return Value(d);
}

class VmapRoundTrip : public ::testing::TestWithParam<Format> {
 protected:
  Value roundTrip(const Value& v) {
    Result<std::string> text = write(v, GetParam());
    EXPECT_TRUE(text.ok()) << text.error().description();
    if (!text.ok()) return Value();
    Result<Value> back = readText(*text);
    EXPECT_TRUE(back.ok()) << back.error().description() << "\n" << *text;
    return back.ok() ? *back : Value();
  }
};

// Key order too: everyKind()'s keys are neither sorted nor hash-ordered.
TEST_P(VmapRoundTrip, EveryKindComesBackIdenticalInOrder) {
  const Value original = everyKind();
  const Value back = roundTrip(original);
  EXPECT_TRUE(identical(original, back));
  ASSERT_TRUE(back.dictionary());
  EXPECT_EQ(back.dictionary()->keys(), original.dictionary()->keys());
}

TEST_P(VmapRoundTrip, EveryKindAsTheRootValue) {
  const Value all = everyKind();
  for (const auto& [key, value] : *all.dictionary())
    EXPECT_TRUE(identical(value, roundTrip(value))) << key;
}

// == counts -0 equal to 0 and every NaN equal to every other; the sign and
// the not-a-number must survive all the same.
TEST_P(VmapRoundTrip, SignOfZeroAndNonFiniteRealsSurvive) {
  const double values[] = {-0.0, std::numeric_limits<double>::quiet_NaN(),
                           std::numeric_limits<double>::infinity(),
                           -std::numeric_limits<double>::infinity(), -1e-300};
  for (double d : values) {
    const std::optional<double> back = roundTrip(Value(d)).real();
    ASSERT_TRUE(back);
    EXPECT_EQ(std::signbit(*back), std::signbit(d)) << d;
    EXPECT_EQ(std::isnan(*back), std::isnan(d));
    if (!std::isnan(d)) {
      EXPECT_EQ(*back, d);
    }
  }
}

// Shortest text must still be exact: walk doubles of every magnitude.
TEST_P(VmapRoundTrip, RealsAreExactAcrossMagnitudes) {
  Array reals;
  for (int e = -1074; e <= 1023; e += 7) {
    const double d = std::ldexp(1.0 + std::ldexp(1.0, -52) * (e & 0xFFFF), e);
    reals.append(d);
    reals.append(std::nextafter(d, 0.0));
  }
  const Value back = roundTrip(Value(reals));
  ASSERT_TRUE(back.array());
  ASSERT_EQ(back.array()->size(), reals.size());
  for (std::size_t i = 0; i < reals.size(); ++i) EXPECT_EQ(*(*back.array())[i].real(), *reals[i].real());
}

INSTANTIATE_TEST_SUITE_P(VmapForms, VmapRoundTrip, ::testing::Values(Format::Xml, Format::Binary),
                         [](const auto& info) { return std::string(formatName(info.param)); });

// Text a person may write, beyond what the writer itself produces.
TEST(VmapXmlReading, AcceptsHandWrittenVariants) {
  const std::string doc =
      "\xEF\xBB\xBF<?xml version='1.0'?>\n"
      "<!-- a comment --><vmap version=\"1.0\">\r\n"
      "<dict>\r\n"
      "  <key>n</key> <integer> +42 </integer>\n"
      "  <key>neg</key><integer>-0</integer>\n"
      "  <key>r</key><real>\n1E3\n</real>\n"
      "  <key>inf</key><real>-inf</real>\n"
      "  <key>d</key><date>2026-11-23T03:24:38.5Z</date>\n"
      "  <key>b64</key><data>\n\tZm9v\n\tYmFy\n</data>\n"
      "  <key>u</key><uuid>e621e1f8-c36c-495a-93fc-0c247a3e6e5f</uuid>\n"
      "  <key>s</key><string><![CDATA[<raw> & ]]>&#x1F600;&lt;</string>\n"
      "  <key>e</key><string/>\n"
      "</dict></vmap>\n";
  Result<Value> v = readText(doc);
  ASSERT_TRUE(v.ok()) << v.error().description();
  const Dictionary& d = *v->dictionary();
  EXPECT_TRUE(identical(d.get("n"), Value(42)));
  EXPECT_TRUE(identical(d.get("neg"), Value(0)));
  EXPECT_TRUE(identical(d.get("r"), Value(1000.0)));
  EXPECT_TRUE(identical(d.get("inf"), Value(-std::numeric_limits<double>::infinity())));
  EXPECT_TRUE(identical(d.get("d"), Value(Date{1795404278.5})));
  EXPECT_TRUE(identical(d.get("b64"), Value(Data{'f', 'o', 'o', 'b', 'a', 'r'})));
  EXPECT_EQ(d.get("u").uuid()->toString(), "E621E1F8-C36C-495A-93FC-0C247A3E6E5F");
  EXPECT_TRUE(identical(d.get("s"), Value("<raw> & \U0001F600<")));
  EXPECT_TRUE(identical(d.get("e"), Value("")));
}

}  // namespace
}  // namespace platform::vmap
