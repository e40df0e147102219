#include "platform/log/Format.h"

#include <gtest/gtest.h>

#include <cerrno>
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

const platform::Uuid kUuid = *platform::Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5f");
constexpr std::string_view kUuidText = "E621E1F8-C36C-495A-93FC-0C247A3E6E5F";

TEST(LogFormat, ConversionsFollowPrintf) {
  // %u and %x see an integer at its own width; integers widen to real.
  EXPECT_EQ(shown("%x %u %.1f", std::int64_t{-1}, static_cast<short>(-1), 2U),
            "ffffffffffffffff 65535 2.0");
  const char* null = nullptr;
  char buffer[4] = {'a', 'b', 'c', 'd'};  // no terminator: must not be overread
  EXPECT_EQ(shown("%s|%s|%@", null, buffer, std::shared_ptr<const platform::Value>()),
            "(null)|abcd|(null)");
  const int small = 1;  // only a byte pointer is trusted to point at 16 bytes
  EXPECT_EQ(shown("%{uuid_t}.16P|%{uuid_t}.16P", kUuid.bytes.data(), &small),
            std::string(kUuidText) + "|<%P?pointer>");
  EXPECT_EQ(shown("open: %{errno}d", ENOENT), "open: [2: No such file or directory]");
}

TEST(LogFormat, ArgumentsThatDoNotFitPrintMarkers) {
  int x = 0;
  EXPECT_EQ(
      shown("%d|%x|%s|%s|%@|%@|%p|%d", "str", 1.5, 5, platform::Value("v"), 5, &x, 5, nullptr),
      "<%d?string>|<%x?double>|<%s?int>|<%s?object>|<%@?int>|<%@?pointer>|<%p?int>|"
      "<%d?null>");
  EXPECT_EQ(shown("%d and %s", 1), "1 and <%s?missing>");
  // An unknown conversion takes no argument, so the next one still lines up;
  // a '*' takes the arguments C would have taken.
  EXPECT_EQ(shown("%k %n %\x01 %d", 1), "<%k?unknown> <%n?unknown> <%??unknown> 1");
  EXPECT_EQ(shown("%*d|%.*s|%d", 5, 1, 3, "abc", 9), "<%*?unsupported>|<%*?unsupported>|9");
  EXPECT_EQ(shown("100%% sure, 100%"), "100% sure, 100<%?incomplete>");
  struct Throws {
    std::string description() const { throw std::runtime_error("no"); }
  };
  EXPECT_EQ(shown("%{public}@|%d", Throws(), 1), "<%@?throws>|1");
}

TEST(LogFormat, RedactionHidesStringsAndObjectsUnlessPublic) {
  std::string secret = "secret";
  platform::Value object("object");
  const char* null = nullptr;
  EXPECT_EQ(redacted("%s|%@|%{public}s|%{public}@|%d|%{private}s|%s", secret, object, secret,
                     object, 5, secret, null),
            "<private>|<private>|secret|object|5|<private>|(null)");
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

  // "a" then two-byte characters: the limit falls inside one, which is dropped whole.
  std::string accents = "a";
  while (accents.size() < kMaxMessageBytes + 10) accents += "\xC3\xA9";
  out = shown("%s", accents);
  ASSERT_EQ(out.size(), cut - 1);
  EXPECT_EQ(out.substr(kMaxMessageBytes - 3, 2), "\xC3\xA9");
}

}  // namespace
}  // namespace platform::log
