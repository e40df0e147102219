// qvctl's command-line parsing: what each accepted line asks for, and the
// message of each refused one.
#include <gtest/gtest.h>

#include <fstream>
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
      {{"find", "rel/A.app"},
       [](const Invocation& i) {
         EXPECT_FALSE(i.findUuid);
         EXPECT_EQ(i.findUrl, "file:///home/user/work/rel/A.app");
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
      {{"help", "find"},
       [](const Invocation& i) {
         EXPECT_EQ(i.command, Command::Help);
         EXPECT_EQ(i.helpTopic, Command::Find);
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
      {{"add", "--bogus", "x"}, "unknown option --bogus"},
      {{"add", "x"}, "cannot make x absolute: the current directory is unknown", ""},
      {{"bulk", "twelve"}, "FLAGS: not a number: twelve"},
      {{"bulk", "1", "2"}, "unexpected argument 2"},
      {{"match", "--flags", "-1"}, "--flags: not a number: -1"},
      {{"match", "--rules", "[1]"}, "--rules: expected a JSON object"},
      {{"match", "--rules", "{}", "K=V"}, "give one of --rules, --rules-file and KEY=PATTERN rules"},
      {{"match", "--rules", "{}", "--rules-file", "/r"},
       "give one of --rules, --rules-file and KEY=PATTERN rules"},
      {{"match", "--rules-file", "/nonexistent/rules.json"}, "--rules-file: /nonexistent/rules.json: "},
      {{"ready", uuidEmptyPath}, "empty path"},
      {{"ready", "--env", "NOVALUE", kU1}, "--env: expected KEY=VALUE, got NOVALUE"},
      {{"access", "--env", "A=B", kU1}, "unknown option --env"},
      {{"annotate", kU1}, "give exactly one of --election 0|1 and --annotations JSON"},
      {{"annotate", kU1, "--election", "2"}, "--election: expected 0 or 1"},
      {{"bulk-annotate", "--annotations", R"({"a": null})"},
       "--annotations: null (or another value with no counterpart) at /a"},
      {{"hold", "--flags", "1", "--flags", "2", "x"}, "--flags given more than once"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.message);
    auto parsed = parse(c.args, c.cwd);
    ASSERT_FALSE(parsed.ok());
    EXPECT_EQ(parsed.error().domain(), qvctl::kUsageErrorDomain);
    EXPECT_EQ(parsed.error().description().rfind(c.message, 0), 0u) << parsed.error().description();
  }
}

// A rules file may be a vmap document or JSON; whatever it holds must be a
// dictionary.
TEST(QvctlArguments, RulesFromAFile) {
  const std::string dir = ::testing::TempDir();
  const std::string vmap = dir + "qvctl-rules.vmap";
  const std::string json = dir + "qvctl-rules.json";
  const std::string list = dir + "qvctl-rules-list.json";
  std::ofstream(vmap) << "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">"
                         "<dict><key>XOExtensionVersion</key><string>&gt;=2</string></dict></vmap>\n";
  std::ofstream(json) << R"({"XOExtensionPointName": ["a", "b"], "Flag": true})";
  std::ofstream(list) << "[1, 2]";
  auto fromVmap = parse({"match", "--rules-file", vmap});
  ASSERT_TRUE(fromVmap.ok()) << fromVmap.error().description();
  EXPECT_EQ(Value(fromVmap.value().rules), Value(Dictionary{{"XOExtensionVersion", ">=2"}}));
  auto fromJson = parse({"match", "--rules-file", json});
  ASSERT_TRUE(fromJson.ok()) << fromJson.error().description();
  EXPECT_EQ(Value(fromJson.value().rules),
            Value(Dictionary{{"XOExtensionPointName", Array{"a", "b"}}, {"Flag", true}}));
  auto fromList = parse({"match", "--rules-file", list});
  ASSERT_FALSE(fromList.ok());
  EXPECT_NE(fromList.error().description().find("expected a JSON object"), std::string::npos);
}

}  // namespace
