// The writers' layout and their refusals: nothing is written that would not
// read back as the same value.
#include <gtest/gtest.h>

#include <cmath>
#include <limits>

#include "platform/vmap/Writer.h"
#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

using testing::hasCode;
using testing::readText;

TEST(VmapWriter, XmlLayoutIsTabIndented) {
  Dictionary inner;
  inner.set("On", true);
  Dictionary d;
  d.set("Name", "Demo & <Co>");
  d.set("Tags", Array{"a", 7});
  d.set("Empty", Array{});
  d.set("Inner", inner);
  const std::string expected =
      "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n"
      "<vmap version=\"1.0\">\n"
      "<dict>\n"
      "\t<key>Name</key>\n"
      "\t<string>Demo &amp; &lt;Co&gt;</string>\n"
      "\t<key>Tags</key>\n"
      "\t<array>\n"
      "\t\t<string>a</string>\n"
      "\t\t<integer>7</integer>\n"
      "\t</array>\n"
      "\t<key>Empty</key>\n"
      "\t<array/>\n"
      "\t<key>Inner</key>\n"
      "\t<dict>\n"
      "\t\t<key>On</key>\n"
      "\t\t<true/>\n"
      "\t</dict>\n"
      "</dict>\n"
      "</vmap>\n";
  Result<std::string> text = write(Value(d), Format::Xml);
  ASSERT_TRUE(text.ok());
  EXPECT_EQ(*text, expected);
}

TEST(VmapWriter, ScalarTextForms) {
  const std::pair<Value, std::string_view> cases[] = {
      {Value(-0.0), "<real>-0</real>"},
      {Value(1e21), "<real>1e+21</real>"},
      {Value(std::numeric_limits<double>::quiet_NaN()), "<real>nan</real>"},
      {Value(-std::numeric_limits<double>::infinity()), "<real>-inf</real>"},
      {Value(std::numeric_limits<std::uint64_t>::max()), "<integer>18446744073709551615</integer>"},
      {Value(Date{1795404278.25}), "<date>2026-11-23T03:24:38.25Z</date>"},
      {Value(Date{1e-7}), "<date>1970-01-01T00:00:00.0000001Z</date>"},
      {Value("a\rb"), "<string>a&#13;b</string>"},
      {Value(Data{0xFB, 0xFF}), "<data>+/8=</data>"},
      {Value(Data{'f'}), "<data>Zg==</data>"},
  };
  for (const auto& [value, element] : cases) {
    Result<std::string> text = write(value, Format::Xml);
    ASSERT_TRUE(text.ok()) << element;
    EXPECT_NE(text->find(std::string(element) + "\n</vmap>"), std::string::npos) << *text;
  }
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
      {"control character in a key", Value(Dictionary{{"a\x01", 1}}), true,
       "the value at \"a\\x01\": the control character U+0001 cannot be written in the XML form "
       "(the binary form carries it)"},
      {"U+FFFE", Value(Array{"ok", "\xEF\xBF\xBE"}), true,
       "the value at [1]: the character U+FFFE cannot be written in the XML form"},
      {"date past 9999", Value(Date{253402300800.0}), true,
       "the root value: the date 253402300800 s from 1970 has no exact text in the years "
       "0000-9999 (the binary form carries it)"},
      {"infinite date", Value(Date{std::numeric_limits<double>::infinity()}), true, nullptr},
      {"invalid UTF-8", Value(Dictionary{{"k", Array{"ab\xC3"}}}), false,
       "the value at k[0]: invalid UTF-8 at byte 2 of the text"},
      {"overlong UTF-8", Value("\xC0\xAF"), false, nullptr},
      {"surrogate", Value("\xED\xA0\x80"), false, nullptr},
      {"invalid UTF-8 key", Value(Dictionary{{"\xFF", 1}}), false,
       "the value at \"\\xFF\": invalid UTF-8 at byte 0 of the text"},
      {"none inside", Value(withNone), false, "the value at [1]: a none value cannot be written"},
      {"none at the root", Value(), false, nullptr},
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
