// Reading refuses every malformed document with the right code and a
// location a person can go to: line and column in the XML form, the file
// offset in the binary form.
#include <gtest/gtest.h>

#include <chrono>

#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

using testing::hasCode;
using testing::infoNumber;
using testing::readText;

constexpr std::string_view kHead =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n";

struct Case {
  std::string_view document;  // after kHead unless `whole`
  ErrorCode code;
  std::int64_t line;  // -1: no line (and no column)
  std::int64_t column;
  std::string_view message;  // the description after "LINE:COLUMN: "
  bool whole = false;
};

const Case kCases[] = {
    {"<dict>\n\t<key>a</key>\n\t<strnig>x</strnig>\n</dict>", ErrorCode::UnknownElement, 5, 2,
     "unknown element <strnig>"},
    {"<dict>\n  oops\n</dict>", ErrorCode::UnexpectedText, 4, 3, "unexpected text \"oops\" in <dict>"},
    {"<array>\u00e9\u00e9 x</array>", ErrorCode::UnexpectedText, 3, 8,
     "unexpected text \"\u00e9\u00e9 x\" in <array>"},
    {"<true>yes</true>", ErrorCode::UnexpectedText, 3, 7, "unexpected text \"yes\" in <true>"},
    {"<dict>\n\t<key>a</key>\n</dict>", ErrorCode::MissingValue, 4, 2, "key \"a\" has no value"},
    {"<dict><key>a</key><key>b</key><true/></dict>", ErrorCode::MissingValue, 3, 7,
     "key \"a\" has no value"},
    {"<dict><string>x</string></dict>", ErrorCode::MisplacedElement, 3, 7,
     "<string> in <dict> where a <key> belongs"},
    {"<array><key>a</key></array>", ErrorCode::MisplacedElement, 3, 8, "<key> outside a <dict>"},
    {"<key>a</key>", ErrorCode::MisplacedElement, 3, 1, "<key> outside a <dict>"},
    {"<string>a<true/></string>", ErrorCode::MisplacedElement, 3, 10, "<true> inside <string>"},
    {"<vmap version=\"1.0\"/>", ErrorCode::MisplacedElement, 3, 1, "<vmap> inside <vmap>"},
    {"<dict><key>a</key><true/><key>a</key><false/></dict>", ErrorCode::DuplicateKey, 3, 26,
     "duplicate key \"a\""},
    {"<integer>12x</integer>", ErrorCode::BadInteger, 3, 1, "bad integer \"12x\": not a decimal integer"},
    {"<integer></integer>", ErrorCode::BadInteger, 3, 1, "bad integer \"\": not a decimal integer"},
    {"<integer>18446744073709551616</integer>", ErrorCode::BadInteger, 3, 1,
     "bad integer \"18446744073709551616\": out of the 64-bit range"},
    {"<integer>-9223372036854775809</integer>", ErrorCode::BadInteger, 3, 1,
     "bad integer \"-9223372036854775809\": out of the 64-bit range"},
    {"<real>infinity</real>", ErrorCode::BadReal, 3, 1, "bad real \"infinity\": not a decimal number"},
    {"<real>.</real>", ErrorCode::BadReal, 3, 1, "bad real \".\": not a decimal number"},
    {"<real>1e400</real>", ErrorCode::BadReal, 3, 1, "bad real \"1e400\": out of the range of a double"},
    {"<data>Zm9</data>", ErrorCode::BadData, 3, 1, "bad base64 data: length is not a multiple of four"},
    {"<data>Zm9v!A==</data>", ErrorCode::BadData, 3, 1, "bad base64 data: character '!' is not base64"},
    {"<data>Zg==Zg==</data>", ErrorCode::BadData, 3, 1, "bad base64 data: data after the padding"},
    {"<data>Z===</data>", ErrorCode::BadData, 3, 1, "bad base64 data: misplaced padding"},
    {"<date>2026-13-01T00:00:00Z</date>", ErrorCode::BadDate, 3, 1,
     "bad date \"2026-13-01T00:00:00Z\": expected YYYY-MM-DDTHH:MM:SS[.fraction]Z"},
    {"<date>2026-11-23T03:24:38+01:00</date>", ErrorCode::BadDate, 3, 1,
     "bad date \"2026-11-23T03:24:38+01:00\": expected YYYY-MM-DDTHH:MM:SS[.fraction]Z"},
    {"<date>2026-11-23T03:24:38.Z</date>", ErrorCode::BadDate, 3, 1,
     "bad date \"2026-11-23T03:24:38.Z\": expected YYYY-MM-DDTHH:MM:SS[.fraction]Z"},
    {"<uuid>E621E1F8-C36C-495A-93FC</uuid>", ErrorCode::BadUuid, 3, 1,
     "bad UUID \"E621E1F8-C36C-495A-93FC\": expected XXXXXXXX-XXXX-XXXX-XXXX-XXXXXXXXXXXX"},
    {"<string lang=\"en\">x</string>", ErrorCode::UnexpectedAttribute, 3, 1,
     "unexpected attribute \"lang\" on <string>"},
    {"<true/>\n<false/>", ErrorCode::ExtraValue, 4, 1, "a second value in <vmap>, which holds one"},
    {"<dict></array>", ErrorCode::MalformedXml, 3, 9, "mismatched tag"},
    {"<string>&lol;</string>", ErrorCode::MalformedXml, 3, 9, "undefined entity"},
    {"<dict><key>k</key><true/>", ErrorCode::MalformedXml, 3, 26, "no element found"},
    {"<?xml version=\"1.0\"?>\n<config version=\"1.0\"><true/></config>", ErrorCode::BadRoot, 2, 1,
     "the root element is <config>, not <vmap>", true},
    {"<vmap><true/></vmap>", ErrorCode::BadRoot, 1, 1, "<vmap> has no version attribute", true},
    // A byte-order mark takes no column; CR LF ends one line.
    {"\xEF\xBB\xBF<vmap version=\"1.0\">\r\n  <strnig/></vmap>", ErrorCode::UnknownElement, 2, 3,
     "unknown element <strnig>", true},
    {"\xEF\xBB\xBF<vmap version=\"1.0\">\r\n  <dict></array></vmap>", ErrorCode::MalformedXml, 2, 11,
     "mismatched tag", true},
    {"<vmap version=\"2.0\"><true/></vmap>", ErrorCode::BadRoot, 1, 1, "vmap version \"2.0\" is not 1.0",
     true},
    {"<vmap version=\"1.0\" mode=\"x\"><true/></vmap>", ErrorCode::UnexpectedAttribute, 1, 1,
     "unexpected attribute \"mode\" on <vmap>", true},
    {"<vmap version=\"1.0\">\n</vmap>", ErrorCode::MissingValue, 1, 1, "<vmap> holds no value", true},
    {"<vmap version=\"1.0\"><true/></vmap>\n<vmap/>", ErrorCode::MalformedXml, 2, 1,
     "junk after document element", true},
    {"<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><vmap version=\"1.0\"><true/></vmap>",
     ErrorCode::ForbiddenDeclaration, 1, 1, "encoding \"ISO-8859-1\" is not UTF-8", true},
    {"{\"json\": true}", ErrorCode::NotAVmapDocument, -1, -1,
     "not a vmap document: it opens with neither '<' (the XML form) nor \"vmapbin1\" (the binary "
     "form)",
     true},
    {"", ErrorCode::NotAVmapDocument, -1, -1, "", true},
};

TEST(VmapReadErrors, XmlErrorTable) {
  for (const Case& c : kCases) {
    const std::string document = c.whole ? std::string(c.document) : std::string(kHead) + std::string(c.document);
    Result<Value> v = readText(document);
    ASSERT_FALSE(v.ok()) << document;
    const Error& e = v.error();
    EXPECT_TRUE(hasCode(e, c.code)) << document << "\n" << e.description();
    EXPECT_EQ(infoNumber(e, kErrorLineKey), c.line) << document;
    EXPECT_EQ(infoNumber(e, kErrorColumnKey), c.column) << document;
    if (c.line > 0) {
      EXPECT_EQ(e.description(), std::to_string(c.line) + ":" + std::to_string(c.column) + ": " +
                                     std::string(c.message));
    } else if (!c.message.empty()) {
      EXPECT_EQ(e.description(), c.message);
    }
  }
}

// A DOCTYPE is refused where it starts, before any entity is defined: the
// exponential entity of "billion laughs" and external entities never expand.
TEST(VmapReadErrors, DoctypeAndEntitiesAreRefusedAtOnce) {
  std::string laughs = "<?xml version=\"1.0\"?>\n<!DOCTYPE vmap [\n<!ENTITY lol0 \"lol\">\n";
  for (int i = 1; i < 10; ++i)
    laughs += "<!ENTITY lol" + std::to_string(i) + " \"" +
              [&] { std::string s; for (int j = 0; j < 10; ++j) s += "&lol" + std::to_string(i - 1) + ";"; return s; }() +
              "\">\n";
  laughs += "]>\n<vmap version=\"1.0\"><string>&lol9;</string></vmap>\n";
  const std::string documents[] = {
      laughs,
      "<?xml version=\"1.0\"?>\n<!DOCTYPE vmap SYSTEM \"file:///etc/passwd\">\n<vmap version=\"1.0\"><string>&x;</string></vmap>",
      "<?xml version=\"1.0\"?>\n<!DOCTYPE vmap>\n<vmap version=\"1.0\"><true/></vmap>",
  };
  for (const std::string& doc : documents) {
    const auto start = std::chrono::steady_clock::now();
    Result<Value> v = readText(doc);
    const auto elapsed = std::chrono::steady_clock::now() - start;
    ASSERT_FALSE(v.ok());
    EXPECT_EQ(v.error().description(), "2:1: DOCTYPE declarations are not allowed");
    EXPECT_TRUE(hasCode(v.error(), ErrorCode::ForbiddenDeclaration));
    EXPECT_LT(elapsed, std::chrono::milliseconds(100));
  }
}

// Binary-form offsets count from the start of the file, magic included.
TEST(VmapReadErrors, BinaryErrorsNameFileOffsets) {
  struct BinaryCase {
    std::string bytes;
    ErrorCode code;
    std::int64_t offset;
    std::string_view message;
  };
  using namespace std::string_literals;
  const BinaryCase cases[] = {
      {"vmapbin1\xA2\x61\x61\x01\x61\x61\x02"s, ErrorCode::DuplicateKey, 12,
       "offset 12: duplicate map key \"a\""},
      {"vmapbin1\x82\x01\xF6"s, ErrorCode::BadBinary, 10, ""},   // null has no vmap kind
      {"vmapbin1\x83\x01\x02"s, ErrorCode::BadBinary, 8,
       "offset 8: array at offset 8 declares 3 elements but only 2 bytes remain"},
      {"vmapbin1\x01\x02"s, ErrorCode::BadBinary, 9, ""},        // trailing bytes
      {"vmapbin1"s, ErrorCode::BadBinary, 8, ""},
  };
  for (const BinaryCase& c : cases) {
    Result<Value> v = readText(c.bytes);
    ASSERT_FALSE(v.ok());
    EXPECT_TRUE(hasCode(v.error(), c.code)) << v.error().description();
    EXPECT_EQ(infoNumber(v.error(), kErrorOffsetKey), c.offset) << v.error().description();
    EXPECT_TRUE(v.error().description().starts_with("offset " + std::to_string(c.offset) + ": "))
        << v.error().description();
    if (!c.message.empty()) {
      EXPECT_EQ(v.error().description(), c.message);
    }
  }
}

}  // namespace
}  // namespace platform::vmap
