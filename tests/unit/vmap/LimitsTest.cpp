// The limits that keep an untrusted document from costing more than it may:
// depth, size and value count in both forms, and what readFile will open.
#include <gtest/gtest.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/vmap/Writer.h"
#include "tests/unit/vmap/VmapTestSupport.h"

namespace platform::vmap {
namespace {

using testing::hasCode;
using testing::infoNumber;
using testing::readText;

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

  Result<std::string> unwritable = write(nested(65), GetParam());
  ASSERT_FALSE(unwritable.ok());
  EXPECT_TRUE(hasCode(unwritable.error(), ErrorCode::TooDeep));

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
  Result<Value> tooLarge = readText(*doc, ReadLimits{.maxBytes = doc->size() - 1});
  ASSERT_FALSE(tooLarge.ok());
  EXPECT_TRUE(hasCode(tooLarge.error(), ErrorCode::TooLarge));

  // The root and its three elements.
  EXPECT_TRUE(readText(*doc, ReadLimits{.maxItems = 4}).ok());
  Result<Value> tooMany = readText(*doc, ReadLimits{.maxItems = 3});
  ASSERT_FALSE(tooMany.ok());
  EXPECT_TRUE(hasCode(tooMany.error(), ErrorCode::TooManyItems)) << tooMany.error().description();
}

INSTANTIATE_TEST_SUITE_P(VmapForms, VmapLimits, ::testing::Values(Format::Xml, Format::Binary),
                         [](const auto& info) { return std::string(formatName(info.param)); });

TEST(VmapLimits, TooDeepXmlNamesTheElement) {
  std::string doc = "<vmap version=\"1.0\">\n";
  for (int i = 0; i < 3; ++i) doc += "<array>";
  Result<Value> v = readText(doc + "\n\t<dict/></array></array></array></vmap>",
                             ReadLimits{.maxDepth = 3});
  ASSERT_FALSE(v.ok());
  EXPECT_EQ(v.error().description(), "3:2: containers nested deeper than 3");
}

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

  Result<Value> directory = readFile(dir.path());
  ASSERT_FALSE(directory.ok());
  EXPECT_EQ(directory.error().description(), dir.path() + ": not a regular file");

  Result<Value> missing = readFile(dir.file("absent.vmap"));
  ASSERT_FALSE(missing.ok());
  EXPECT_TRUE(missing.error().is(kPosixErrorDomain, ENOENT));
  EXPECT_EQ(missing.error().description(), dir.file("absent.vmap") + ": No such file or directory");

  Result<Value> relative = readFile("Info.vmap");
  ASSERT_FALSE(relative.ok());
  EXPECT_TRUE(hasCode(relative.error(), ErrorCode::InvalidArgument));
}

TEST(VmapReadFile, ErrorsCarryThePath) {
  testing::ScratchDirectory dir;
  const std::string path = dir.file("Info.vmap");
  testing::writeText(path, "<?xml version=\"1.0\"?>\n<vmap version=\"1.0\">\n<dict>\n\t<key>a</key>\n"
                           "\t<strnig/>\n</dict>\n</vmap>\n");
  Result<Value> v = readFile(path);
  ASSERT_FALSE(v.ok());
  EXPECT_EQ(v.error().description(), path + ":5:2: unknown element <strnig>");
  EXPECT_EQ(*v.error().userInfo()->get(kErrorPathKey).string(), path);
  EXPECT_EQ(infoNumber(v.error(), kErrorLineKey), 5);

  testing::writeText(path, std::string("vmapbin1\x82\x01", 10));
  v = readFile(path);
  ASSERT_FALSE(v.ok());
  EXPECT_TRUE(v.error().description().starts_with(path + ": offset 8: ")) << v.error().description();
}

}  // namespace
}  // namespace platform::vmap
