// Reading refuses every malformed document with the right code and a
// location a person can go to (line and column in the XML form, the file
// offset in the binary form), and keeps within its limits.
#include <fcntl.h>
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <chrono>

#include "platform/vmap/Writer.h"
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
    {"<array>\u00e9\u00e9 x</array>", ErrorCode::UnexpectedText, 3, 8,
     "unexpected text \"\u00e9\u00e9 x\" in <array>"},
    {"<dict><key>a</key><key>b</key><true/></dict>", ErrorCode::MissingValue, 3, 7,
     "key \"a\" has no value"},
    {"<dict><key>a</key><true/><key>a</key><false/></dict>", ErrorCode::DuplicateKey, 3, 26,
     "duplicate key \"a\""},
    {"<integer>18446744073709551616</integer>", ErrorCode::BadInteger, 3, 1,
     "bad integer \"18446744073709551616\": out of the 64-bit range"},
    {"<data>Zg==Zg==</data>", ErrorCode::BadData, 3, 1, "bad base64 data: data after the padding"},
    {"<date>2026-11-23T03:24:38.Z</date>", ErrorCode::BadDate, 3, 1,
     "bad date \"2026-11-23T03:24:38.Z\": expected YYYY-MM-DDTHH:MM:SS[.fraction]Z"},
    {"<dict><key>k</key><true/>", ErrorCode::MalformedXml, 3, 26, "no element found"},
    // A byte-order mark takes no column; CR LF ends one line.
    {"\xEF\xBB\xBF<vmap version=\"1.0\">\r\n  <dict></array></vmap>", ErrorCode::MalformedXml, 2, 11,
     "mismatched tag", true},
    {"<vmap version=\"2.0\"><true/></vmap>", ErrorCode::BadRoot, 1, 1, "vmap version \"2.0\" is not 1.0",
     true},
    {"<?xml version=\"1.0\" encoding=\"ISO-8859-1\"?><vmap version=\"1.0\"><true/></vmap>",
     ErrorCode::ForbiddenDeclaration, 1, 1, "encoding \"ISO-8859-1\" is not UTF-8", true},
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
  for (int i = 1; i < 10; ++i) {
    laughs += "<!ENTITY lol" + std::to_string(i) + " \"";
    for (int j = 0; j < 10; ++j) laughs += "&lol" + std::to_string(i - 1) + ";";
    laughs += "\">\n";
  }
  laughs += "]>\n<vmap version=\"1.0\"><string>&lol9;</string></vmap>\n";
  const std::string documents[] = {
      laughs,
      "<?xml version=\"1.0\"?>\n<!DOCTYPE vmap SYSTEM \"file:///etc/passwd\">\n<vmap version=\"1.0\"><string>&x;</string></vmap>",
  };
  for (const std::string& doc : documents) {
    const auto start = std::chrono::steady_clock::now();
    Result<Value> v = readText(doc);
    const auto elapsed = std::chrono::steady_clock::now() - start;
    ASSERT_FALSE(v.ok());
    EXPECT_EQ(v.error().description(), "2:1: DOCTYPE declarations are not allowed");
    EXPECT_TRUE(hasCode(v.error(), ErrorCode::ForbiddenDeclaration));
    EXPECT_LT(elapsed, std::chrono::seconds(1)) << "refused before any expansion";
  }
}

// Binary-form offsets count from the start of the file, magic included.
TEST(VmapReadErrors, BinaryErrorsNameFileOffsets) {
  struct BinaryCase {
    std::string bytes;
    ErrorCode code;
    std::int64_t offset;
    std::string_view message;  // empty: only the offset prefix is checked
  };
  using namespace std::string_literals;
  const BinaryCase cases[] = {
      {"vmapbin1\xA2\x61\x61\x01\x61\x61\x02"s, ErrorCode::DuplicateKey, 12,
       "offset 12: duplicate map key \"a\""},
      {"vmapbin1\x83\x01\x02"s, ErrorCode::BadBinary, 8,
       "offset 8: array at offset 8 declares 3 elements but only 2 bytes remain"},
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

// `depth` containers, dictionaries and arrays taking turns, around a string.
Value nested(std::size_t depth) {
  Value v("core");
  for (std::size_t i = 0; i < depth; ++i)
    v = i % 2 ? Value(Dictionary{{"d", v}}) : Value(Array{v});
  return v;
}

class VmapLimits : public ::testing::TestWithParam<Format> {};

TEST_P(VmapLimits, DepthSixtyFourIsReadAndSixtyFiveRefused) {
  Result<std::string> ok = write(nested(64), GetParam());
  ASSERT_TRUE(ok.ok());
  EXPECT_TRUE(readText(*ok).ok());

  Result<std::string> deep = write(nested(65), GetParam(), WriteLimits{.maxDepth = 65});
  ASSERT_TRUE(deep.ok());
  Result<Value> refused = readText(*deep);
  ASSERT_FALSE(refused.ok());
  EXPECT_TRUE(hasCode(refused.error(), ErrorCode::TooDeep)) << refused.error().description();
  EXPECT_TRUE(readText(*deep, ReadLimits{.maxDepth = 65}).ok());
}

TEST_P(VmapLimits, SizeAndItemBounds) {
  Result<std::string> doc = write(Value(Array{1, 2, 3}), GetParam());
  ASSERT_TRUE(doc.ok());
  EXPECT_TRUE(readText(*doc, ReadLimits{.maxBytes = doc->size()}).ok());
  EXPECT_TRUE(hasCode(readText(*doc, ReadLimits{.maxBytes = doc->size() - 1}).error(), ErrorCode::TooLarge));

  // The root and its three elements.
  EXPECT_TRUE(readText(*doc, ReadLimits{.maxItems = 4}).ok());
  Result<Value> tooMany = readText(*doc, ReadLimits{.maxItems = 3});
  ASSERT_FALSE(tooMany.ok());
  EXPECT_TRUE(hasCode(tooMany.error(), ErrorCode::TooManyItems)) << tooMany.error().description();
}

INSTANTIATE_TEST_SUITE_P(VmapForms, VmapLimits, ::testing::Values(Format::Xml, Format::Binary),
                         [](const auto& info) { return std::string(formatName(info.param)); });

TEST(VmapReadFile, RefusesWhatIsNotASmallRegularFile) {
  testing::ScratchDirectory dir;
  // A file far larger than memory, but sparse: refused by its size alone.
  const std::string huge = dir.file("huge.vmap");
  const int fd = ::open(huge.c_str(), O_CREAT | O_WRONLY, 0644);
  ASSERT_GE(fd, 0);
  ASSERT_EQ(::ftruncate(fd, off_t{1} << 40), 0);
  ::close(fd);
  Result<Value> big = readFile(huge);
  ASSERT_FALSE(big.ok());
  EXPECT_TRUE(hasCode(big.error(), ErrorCode::TooLarge));
  EXPECT_EQ(big.error().description(),
            huge + ": document is 1099511627776 bytes; the limit is 16777216");

  const std::string fifo = dir.file("fifo.vmap");
  ASSERT_EQ(::mkfifo(fifo.c_str(), 0644), 0);
  Result<Value> pipe = readFile(fifo);  // must not wait for a writer
  ASSERT_FALSE(pipe.ok());
  EXPECT_TRUE(hasCode(pipe.error(), ErrorCode::NotARegularFile));

  Result<Value> relative = readFile("Info.vmap");
  ASSERT_FALSE(relative.ok());
  EXPECT_TRUE(hasCode(relative.error(), ErrorCode::InvalidArgument));
}

}  // namespace
}  // namespace platform::vmap
