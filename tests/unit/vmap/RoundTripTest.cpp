// Whatever is written reads back as the same value, kind for kind, in both
// forms; the writers' layout, and their refusal of what would not read back.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/vmap/Writer.h"
#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

using testing::hasCode;
using testing::identical;
using testing::readText;

Value everyKind() {
  Data bytes;
  for (int i = 0; i < 256; ++i) bytes.push_back(static_cast<std::uint8_t>(i));
  Dictionary d;
  d.set("unicode", "Gr\u00fc\u00dfe \u2014 \u65e5\u672c\u8a9e \U0001F600");
  d.set("markup", "a < b && c > d ]]> \"q\" 'a' &amp;");
  d.set("line ends", "one\r\ntwo\rthree\nfour\tfive  ");
  d.set("", "the empty key");
  d.set("uint max", std::numeric_limits<std::uint64_t>::max());
  d.set("uint past int", std::uint64_t{1} << 63);
  d.set("tiny fraction", Date{1795404278.0 + std::ldexp(1.0, -22)});
  d.set("year 9999", Date{253402300799.75});
  d.set("data", bytes);  // every byte, and base64 with two '=' of padding
  d.set("uuid", *Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F"));
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
  EXPECT_TRUE(identical(Value("root"), roundTrip(Value("root"))));  // a scalar at the root
}

// == counts -0 equal to 0 and every NaN equal to every other; the sign and
// the not-a-number must survive all the same.
TEST_P(VmapRoundTrip, SignOfZeroAndNonFiniteRealsSurvive) {
  const double values[] = {-0.0, std::numeric_limits<double>::quiet_NaN(),
                           -std::numeric_limits<double>::infinity()};
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

TEST(VmapWriter, XmlLayoutIsTabIndented) {
  Dictionary d;
  d.set("Name", "Demo & <Co>");
  d.set("Tags", Array{7, Dictionary{{"On", true}}});
  d.set("Empty", Array{});
  const std::string expected =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n<dict>\n"
      "\t<key>Name</key>\n\t<string>Demo &amp; &lt;Co&gt;</string>\n"
      "\t<key>Tags</key>\n\t<array>\n\t\t<integer>7</integer>\n"
      "\t\t<dict>\n\t\t\t<key>On</key>\n\t\t\t<true/>\n\t\t</dict>\n\t</array>\n"
      "\t<key>Empty</key>\n\t<array/>\n</dict>\n</vmap>\n";
  Result<std::string> text = write(Value(d), Format::Xml);
  ASSERT_TRUE(text.ok());
  EXPECT_EQ(*text, expected);
}

struct Refusal {
  const char* name;
  Value value;
  bool binaryCarriesIt;
  const char* message;  // of the XML writer
};

// Each refusal names the value that could not be written.
TEST(VmapWriter, RefusesWhatCouldNotBeReadBack) {
  Array withNone{1, Value()};
  const Refusal cases[] = {
      {"control character", Value(Dictionary{{"Name", "bell\a"}}), true,
       "the value at Name: the control character U+0007 cannot be written in the XML form (the "
       "binary form carries it)"},
      {"U+FFFE", Value(Array{"ok", "\xEF\xBF\xBE"}), true,
       "the value at [1]: the character U+FFFE cannot be written in the XML form"},
      {"date past 9999", Value(Date{253402300800.0}), true,
       "the root value: the date 253402300800 s from 1970 has no exact text in the years "
       "0000-9999 (the binary form carries it)"},
      {"invalid UTF-8", Value(Dictionary{{"k", Array{"ab\xC3"}}}), false,
       "the value at k[0]: invalid UTF-8 at byte 2 of the text"},
      {"none inside", Value(withNone), false, "the value at [1]: a none value cannot be written"},
  };
  for (const Refusal& c : cases) {
    Result<std::string> xml = write(c.value, Format::Xml);
    ASSERT_FALSE(xml.ok()) << c.name;
    EXPECT_TRUE(hasCode(xml.error(), ErrorCode::NotRepresentable)) << c.name;
    if (c.message) {
      EXPECT_EQ(xml.error().description(), c.message);
    }
    Result<std::string> binary = write(c.value, Format::Binary);
    EXPECT_EQ(binary.ok(), c.binaryCarriesIt) << c.name;
    if (binary.ok()) {
      Result<Value> back = readText(*binary);
      ASSERT_TRUE(back.ok()) << c.name;
      EXPECT_TRUE(testing::identical(c.value, *back)) << c.name;
    }
  }
}

}  // namespace
}  // namespace platform::vmap
