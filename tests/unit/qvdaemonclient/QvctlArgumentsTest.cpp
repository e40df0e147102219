// qvctl's command-line parsing: what each accepted line asks for, and the
// message of each refused one.
#include <gtest/gtest.h>

#include <functional>

#include "Quorvex/QVDConstants.h"
#include "tools/qvctl/QvctlArguments.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using qvctl::Command;
using qvctl::Invocation;

constexpr const char* kCwd = "/home/user/work";
constexpr const char* kU1 = "6F1A0C2E-3B7D-4C55-9E0A-1D2B3C4D5E6F";
constexpr const char* kU2 = "e621e1f8-c36c-495a-93fc-0c247a3e6e5f";
const Uuid kUuid1 = *Uuid::parse(kU1);
const Uuid kUuid2 = *Uuid::parse(kU2);

platform::Result<Invocation> parse(std::vector<std::string_view> args,
                                   std::string_view cwd = kCwd) {
  return qvctl::parseArguments(args, cwd);
}

TEST(QvctlArguments, AcceptedCommandLines) {
  const std::string withPath = std::string(kU1) + "=Plug.ovx";
  struct Case {
    std::vector<std::string_view> args;
    std::function<void(const Invocation&)> check;
  };
  const Case cases[] = {
      {{"add", "a/b/../c.ovx", "/abs/x.ovx", "./d/"},
       [](const Invocation& i) {
         EXPECT_EQ(i.command, Command::Add);
         EXPECT_EQ(i.paths, (std::vector<std::string>{"/home/user/work/a/c.ovx", "/abs/x.ovx",
                                                      "/home/user/work/d"}));
       }},
      {{"--json", "--service", "qvd.test", "bulk", "0x200"},
       [](const Invocation& i) {
         EXPECT_EQ(i.command, Command::Bulk);
         EXPECT_EQ(i.format, qvctl::OutputFormat::Json);
         EXPECT_EQ(i.service, "qvd.test");
         EXPECT_EQ(i.flags, 0x200u);
       }},
      {{"match", "--sync", "--flags=1", "XOExtensionPointName=com.x", "K=a=b", "--json"},
       [](const Invocation& i) {
         EXPECT_EQ(i.flags, 0x401u);
         EXPECT_EQ(i.format, qvctl::OutputFormat::Json);
         EXPECT_EQ(Value(i.rules),
                   Value(Dictionary{{"XOExtensionPointName", "com.x"}, {"K", "a=b"}}));
       }},
      {{"match", "--rules", R"({"K": [1, "x", 2.5, true], "N": {"deep": -3}})"},
       [](const Invocation& i) {
         EXPECT_EQ(i.flags, 0u);
         EXPECT_EQ(Value(i.rules), Value(Dictionary{{"K", Array{1, "x", 2.5, true}},
                                                    {"N", Dictionary{{"deep", -3}}}}));
       }},
      {{"find", kU2}, [](const Invocation& i) { EXPECT_EQ(i.findUuid, kUuid2); }},
      {{"find", "rel/A.app"},
       [](const Invocation& i) {
         EXPECT_FALSE(i.findUuid);
         EXPECT_EQ(i.findUrl, "file:///home/user/work/rel/A.app");
       }},
      {{"find", "file:///x/A%20B.app"},
       [](const Invocation& i) { EXPECT_EQ(i.findUrl, "file:///x/A%20B.app"); }},
      {{"access", "--sync", kU1},
       [](const Invocation& i) {
         EXPECT_EQ(i.sending, QVDSending::Synchronous);
         EXPECT_EQ(i.plugIns, (QVDPlugInMap{{"", kUuid1}}));
       }},
      {{"annotate", kU1, kU2, "--election", "1"},
       [](const Invocation& i) {
         EXPECT_EQ(i.uuids, (std::vector<Uuid>{kUuid1, kUuid2}));
         EXPECT_EQ(Value(i.annotations),
                   Value(Dictionary{{std::string(QVUserElectionAttribute), 1}}));
       }},
      {{"bulk-annotate", "--annotations", R"({"a": {"b": 0}})"},
       [](const Invocation& i) {
         EXPECT_EQ(Value(i.annotations), Value(Dictionary{{"a", Dictionary{{"b", 0}}}}));
       }},
      {{"hold", "--flags", "3", "--", "-odd-name"},
       [](const Invocation& i) {
         EXPECT_EQ(i.flags, 3u);
         EXPECT_EQ(i.paths, std::vector<std::string>{"/home/user/work/-odd-name"});
       }},
      // ready: UUID=PATH pairs keep their order, the environment comes along.
      {{"ready", "--env", "LANG=C", "--env=EMPTY=", withPath, kU2, "--flags", "7"},
       [](const Invocation& i) {
         EXPECT_EQ(i.plugIns, (QVDPlugInMap{{"/home/user/work/Plug.ovx", kUuid1}, {"", kUuid2}}));
         ASSERT_TRUE(i.environment);
         EXPECT_EQ(Value(*i.environment), Value(Dictionary{{"LANG", "C"}, {"EMPTY", ""}}));
         EXPECT_EQ(i.flags, 7u);
         EXPECT_EQ(i.sending, QVDSending::Asynchronous);
       }},
      {{"release", kU2},
       [](const Invocation& i) { EXPECT_EQ(i.uuids, std::vector<Uuid>{kUuid2}); }},
      {{"watch", "--count", "2"}, [](const Invocation& i) { EXPECT_EQ(i.count, 2u); }},
      {{"help", "find"},
       [](const Invocation& i) {
         EXPECT_EQ(i.command, Command::Help);
         EXPECT_EQ(i.helpTopic, Command::Find);
       }},
      {{"find", "--help"}, [](const Invocation& i) { EXPECT_EQ(i.helpTopic, Command::Find); }},
      {{"--help"},
       [](const Invocation& i) {
         EXPECT_EQ(i.command, Command::Help);
         EXPECT_FALSE(i.helpTopic);
       }},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(std::string(c.args.front()) + " ...");
    auto parsed = parse(c.args);
    ASSERT_TRUE(parsed.ok()) << parsed.error().description();
    c.check(parsed.value());
  }
}

TEST(QvctlArguments, RefusedCommandLinesSayWhy) {
  const std::string uuidEmptyPath = std::string(kU1) + "=";
  struct Case {
    std::vector<std::string_view> args;
    const char* message;
    std::string_view cwd = kCwd;
  };
  const Case cases[] = {
      {{}, "no command given"},
      {{"frobnicate"}, "unknown command frobnicate"},
      {{"add"}, "too few arguments"},
      {{"add", "--bogus", "x"}, "unknown option --bogus"},
      {{"add", "x"}, "cannot make x absolute: the current directory is unknown", ""},
      {{"--service"}, "--service needs a value"},
      {{"bulk", "twelve"}, "FLAGS: not a number: twelve"},
      {{"bulk", "1", "2"}, "unexpected argument 2"},
      {{"match", "--flags"}, "--flags needs a value"},
      {{"match", "--flags", "-1"}, "--flags: not a number: -1"},
      {{"match", "--rules", "[1]"}, "--rules: expected a JSON object"},
      {{"match", "--rules", "{"}, "--rules: not valid JSON"},
      {{"match", "--rules", "{}", "K=V"}, "give --rules or KEY=PATTERN rules, not both"},
      {{"match", "=V"}, "rule: expected KEY=VALUE, got =V"},
      {{"find"}, "too few arguments"},
      {{"find", "a", "b"}, "unexpected argument b"},
      {{"ready", "not-a-uuid"}, "not a UUID: not-a-uuid"},
      {{"ready", uuidEmptyPath}, "empty path"},
      {{"ready", "--env", "NOVALUE", kU1}, "--env: expected KEY=VALUE, got NOVALUE"},
      {{"access", "--env", "A=B", kU1}, "unknown option --env"},
      {{"annotate", kU1}, "give exactly one of --election 0|1 and --annotations JSON"},
      {{"annotate", kU1, "--election", "2"}, "--election: expected 0 or 1"},
      {{"annotate", kU1, "--election", "1", "--annotations", "{}"}, "give exactly one of"},
      {{"bulk-annotate"}, "--annotations JSON is required"},
      {{"bulk-annotate", "--annotations", R"({"a": null})"},
       "--annotations: null (or another value with no counterpart) at /a"},
      {{"hold", "--flags", "1", "--flags", "2", "x"}, "--flags given more than once"},
      {{"release", "token"}, "not a UUID: token"},
      {{"watch", "--count", "0"}, "--count: must be at least 1"},
      {{"help", "nothing"}, "unknown command nothing"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.message);
    auto parsed = parse(c.args, c.cwd);
    ASSERT_FALSE(parsed.ok());
    EXPECT_EQ(parsed.error().domain(), qvctl::kUsageErrorDomain);
    EXPECT_EQ(parsed.error().description().rfind(c.message, 0), 0u) << parsed.error().description();
  }
}

TEST(QvctlArguments, NumbersAreDecimalOrHexWithNothingElse) {
  const std::pair<std::string_view, std::optional<std::uint64_t>> cases[] = {
      {"0", 0},
      {"1024", 1024},
      {"0x400", 0x400},
      {"0XfF", 0xff},
      {"18446744073709551615", UINT64_MAX},
      {"18446744073709551616", std::nullopt},
      {"", std::nullopt},
      {"0x", std::nullopt},
      {"+1", std::nullopt},
      {"1k", std::nullopt},
  };
  for (const auto& [text, number] : cases) {
    EXPECT_EQ(qvctl::parseNumber(text), number) << text;
  }
}

}  // namespace
