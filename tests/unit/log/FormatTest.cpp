#include "platform/log/Format.h"

#include <gtest/gtest.h>

#include <cerrno>
#include <cstdint>
#include <cstdio>
#include <limits>
#include <memory>
#include <stdexcept>
#include <string>

#include "LogTestSupport.h"
#include "platform/values/Error.h"
#include "platform/values/Value.h"

namespace platform::log {
namespace {

template <typename... Args>
std::string shown(std::string_view format, const Args&... args) {
  return formatMessage(Redaction::Off, format, args...);
}

template <typename... Args>
std::string redacted(std::string_view format, const Args&... args) {
  return formatMessage(Redaction::On, format, args...);
}

using testing::Counted;

enum class Color : std::uint8_t { Red = 1, Green = 2 };

const platform::Uuid kUuid = *platform::Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5f");
constexpr std::string_view kUuidText = "E621E1F8-C36C-495A-93FC-0C247A3E6E5F";

TEST(LogFormat, NumbersFollowPrintf) {
  EXPECT_EQ(shown("%d %i %u %ld %zu %lld", -5, 7, 3u, -1L, std::size_t{5}, -2LL), "-5 7 3 -1 5 -2");
  EXPECT_EQ(shown("%5d|%-5d|%05d|%+d|% d|%.3d", 42, 42, 42, 42, 42, 7),
            "   42|42   |00042|+42| 42|007");
  EXPECT_EQ(shown("%x %X %#x %#o", 255, 255, 255, 8), "ff FF 0xff 010");
  EXPECT_EQ(shown("%d|%d", std::numeric_limits<std::int64_t>::min(),
                  std::numeric_limits<std::uint64_t>::max()),
            "-9223372036854775808|18446744073709551615");
  // %u and %x see an integer at its own width; length modifiers change nothing.
  EXPECT_EQ(shown("%x %x %u", -1, std::int64_t{-1}, static_cast<short>(-1)),
            "ffffffff ffffffffffffffff 65535");
  EXPECT_EQ(shown("%hhd", 300), "300");
  EXPECT_EQ(shown("%d %c %d %3c|%-3c|", true, 'A', Color::Green, 'x', 'y'), "1 A 2   x|y  |");
  EXPECT_EQ(shown("%f|%8.3f|%-6.1f|%e|%g", 1.5, 3.14159, 0.5, 12345.678, 1e20),
            "1.500000|   3.142|0.5   |1.234568e+04|1e+20");
  EXPECT_EQ(shown("%f %.1f", 3, 2U), "3.000000 2.0");  // integers widen to real
}

TEST(LogFormat, TextObjectsAndPointers) {
  std::string owned = "owned";
  const char* null = nullptr;
  char buffer[4] = {'a', 'b', 'c', 'd'};  // no terminator: must not be overread
  EXPECT_EQ(shown("%s %s %s|%s", owned, std::string_view("view"), null, buffer),
            "owned view (null)|abcd");
  EXPECT_EQ(shown("[%6s][%-6s][%.3s]", "abc", "abc", "abcdef"), "[   abc][abc   ][abc]");

  Counted counted;
  platform::Value value(std::int64_t{42});
  platform::Error error("Domain", 7, "it broke");
  std::shared_ptr<const platform::Value> none;
  EXPECT_EQ(shown("%@ %@ %@ %@ %@", counted, value, error, none, &value),
            "counted " + value.description() + " it broke (null) " + value.description());
  EXPECT_EQ(shown("%@ %@", "literal", kUuid), "literal " + std::string(kUuidText));

  int x = 0;
  char expected[32];
  std::snprintf(expected, sizeof expected, "%p", static_cast<void*>(&x));
  EXPECT_EQ(shown("%p", &x), expected);
  EXPECT_EQ(shown("%p|%5p|", static_cast<int*>(nullptr), nullptr), "0x0|  0x0|");
}

TEST(LogFormat, UuidAndErrnoForms) {
  std::array<std::uint8_t, 16> array = kUuid.bytes;
  const std::uint8_t* bytes = kUuid.bytes.data();
  const std::uint8_t* null = nullptr;
  const int small = 1;
  EXPECT_EQ(shown("%{uuid_t}.16P|%{public, uuid_t}.16P|%{uuid_t}.16P", kUuid, array, bytes),
            std::string(kUuidText) + "|" + std::string(kUuidText) + "|" + std::string(kUuidText));
  EXPECT_EQ(shown("%{uuid_t}.16P", null), "(null)");
  // Only a byte pointer is trusted to point at 16 bytes.
  EXPECT_EQ(shown("%{uuid_t}.16P|%{uuid_t}.16P", &small, "text"), "<%P?pointer>|<%P?string>");
  EXPECT_EQ(shown("%{uuid_t}.15P|%.16P", kUuid, kUuid), "<%P?unknown>|<%P?unknown>");

  EXPECT_EQ(shown("open: %{errno}d", ENOENT), "open: [2: No such file or directory]");
  EXPECT_EQ(shown("%{errno}d", 99999).rfind("[99999: ", 0), 0u);
  EXPECT_EQ(shown("%{errno}d", std::int64_t{1} << 40), "[1099511627776: Unknown error]");
  EXPECT_EQ(shown("%{errno}d", "two"), "<%d?string>");
}

TEST(LogFormat, ArgumentsThatDoNotFitPrintMarkers) {
  int x = 0;
  EXPECT_EQ(
      shown("%d|%x|%s|%s|%@|%@|%p|%d", "str", 1.5, 5, platform::Value("v"), 5, &x, 5, nullptr),
      "<%d?string>|<%x?double>|<%s?int>|<%s?object>|<%@?int>|<%@?pointer>|<%p?int>|"
      "<%d?null>");
  EXPECT_EQ(shown("%d and %s", 1), "1 and <%s?missing>");
  EXPECT_EQ(shown("%d", 1, 2, "three"), "1");
  // An unknown conversion takes no argument, so the next one still lines up;
  // a '*' takes the arguments C would have taken.
  EXPECT_EQ(shown("%k %n %\x01 %d", 1), "<%k?unknown> <%n?unknown> <%??unknown> 1");
  EXPECT_EQ(shown("%*d|%.*s|%d", 5, 1, 3, "abc", 9), "<%*?unsupported>|<%*?unsupported>|9");
  EXPECT_EQ(shown("100%% sure, 100%"), "100% sure, 100<%?incomplete>");
  EXPECT_EQ(shown("%-08.3l"), "<%?incomplete>");
  struct Throws {
    std::string description() const { throw std::runtime_error("no"); }
  };
  EXPECT_EQ(shown("%{public}@|%d", Throws(), 1), "<%@?throws>|1");
}

TEST(LogFormat, FieldsAndAnnotationsAreBounded) {
  EXPECT_EQ(shown("%1024d", 1).size(), 1024u);
  EXPECT_EQ(shown("%1025d|%.99999999999999999999f|%d", 1, 1.0, 2), "<%d?width>|<%f?width>|2");
  EXPECT_EQ(shown("%{public"), "<%{?annotation>public");
  EXPECT_EQ(shown("%{" + std::string(65, 'x') + "}d", 1).rfind("<%{?annotation>", 0), 0u);
  EXPECT_EQ(shown("%{" + std::string(64, 'x') + "}d", 1), "1");  // unknown words are ignored
}

TEST(LogFormat, RedactionHidesStringsAndObjectsUnlessPublic) {
  std::string secret = "secret";
  platform::Value object("object");
  const char* null = nullptr;
  EXPECT_EQ(redacted("%s|%@|%{public}s|%{public}@|%d|%{private}s|%s", secret, object, secret,
                     object, 5, secret, null),
            "<private>|<private>|secret|object|5|<private>|(null)");
  EXPECT_EQ(redacted("%{uuid_t}.16P", kUuid), kUuidText);
  EXPECT_EQ(shown("%s|%{private}@", secret, object), "secret|<private>");
  // A redacted object is never described: its text is not needed.
  Counted counted;
  EXPECT_EQ(redacted("%@", counted), "<private>");
  EXPECT_EQ(counted.calls.load(), 0);
  EXPECT_EQ(redacted("%{public}@", counted), "counted");
  EXPECT_EQ(counted.calls.load(), 1);
}

TEST(LogFormat, LongMessagesAreCutWithAMarker) {
  const std::size_t cut = kMaxMessageBytes + kTruncatedMarker.size();
  std::string out = shown("%s", std::string(kMaxMessageBytes + 100, 'a'));
  ASSERT_EQ(out.size(), cut);
  EXPECT_EQ(out.substr(kMaxMessageBytes), kTruncatedMarker);
  EXPECT_EQ(shown("%s", std::string(kMaxMessageBytes, 'b')).size(), kMaxMessageBytes);
  EXPECT_EQ(shown(std::string(kMaxMessageBytes * 2, 'c')).size(), cut);
  EXPECT_EQ(shown("%@", platform::Value(std::string(kMaxMessageBytes * 2, 'd'))).size(), cut);

  // "a" then two-byte characters: the limit falls inside one, which is dropped whole.
  std::string accents = "a";
  while (accents.size() < kMaxMessageBytes + 10) accents += "\xC3\xA9";
  out = shown("%s", accents);
  ASSERT_EQ(out.size(), cut - 1);
  EXPECT_EQ(out.substr(kMaxMessageBytes - 3, 2), "\xC3\xA9");
}

}  // namespace
}  // namespace platform::log
