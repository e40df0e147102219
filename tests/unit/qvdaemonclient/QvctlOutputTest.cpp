// qvctl's output: the human listing, JSON both ways, base64.
#include <gtest/gtest.h>

#include "tools/qvctl/QvctlJson.h"
#include "tools/qvctl/QvctlOutput.h"

namespace {

using platform::Array;
using platform::Dictionary;
using platform::Value;

const platform::Uuid kUuid = *platform::Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5f");

TEST(QvctlOutput, HumanListingIndentsNestedContainers) {
  const Value value(Dictionary{
      {"name", "Share"},
      {"uuid", kUuid},
      {"when", platform::Date{0.5}},
      {"bytes", platform::Data{1, 2, 3}},
      {"list", Array{1, Dictionary{{"k", false}}, Array{}}},
      {"empty", Dictionary{}},
      {"big", 18446744073709551615ull},
      {"real", 2.5},
  });
  EXPECT_EQ(qvctl::formatHuman(value),
            "name: Share\n"
            "uuid: E621E1F8-C36C-495A-93FC-0C247A3E6E5F\n"
            "when: 1970-01-01T00:00:00.5Z\n"
            "bytes: <3 bytes> AQID\n"
            "list:\n"
            "  - 1\n"
            "  -\n"
            "    k: false\n"
            "  - []\n"
            "empty: {}\n"
            "big: 18446744073709551615\n"
            "real: 2.5\n");
}

TEST(QvctlOutput, FormsAreNumberedWhateverKeysTheyHave) {
  const std::pair<Value, const char*> cases[] = {
      {Array{Dictionary{{"XOExtensionIdentifier", "com.a"}}, Dictionary{{"path", "/b"}, {"n", 2}}},
       "2 plug-ins\n"
       "plug-in 1:\n"
       "  XOExtensionIdentifier: com.a\n"
       "plug-in 2:\n"
       "  path: /b\n"
       "  n: 2\n"},
      {Dictionary{{"only", "one"}}, "1 plug-in\nplug-in 1:\n  only: one\n"},
      {Array{}, "no plug-ins\n"},
      {Value(), "no plug-ins\n"},
      {Array{"odd"}, "1 plug-in\nplug-in 1: odd\n"},
  };
  for (const auto& [forms, text] : cases) EXPECT_EQ(qvctl::formatForms(forms), text);
}

TEST(QvctlOutput, JsonOutputSpellsOutTheKindsJsonLacks) {
  const Value value(Dictionary{{"uuid", kUuid},
                               {"date", platform::Date{1795404278}},
                               {"data", platform::Data{0xff}},
                               {"n", Array{-1, 18446744073709551615ull, 0.25, true}}});
  EXPECT_EQ(qvctl::formatJson(value),
            "{\n"
            "  \"uuid\": \"E621E1F8-C36C-495A-93FC-0C247A3E6E5F\",\n"
            "  \"date\": \"2026-11-23T03:24:38Z\",\n"
            "  \"data\": \"/w==\",\n"
            "  \"n\": [\n"
            "    -1,\n"
            "    18446744073709551615,\n"
            "    0.25,\n"
            "    true\n"
            "  ]\n"
            "}\n");
}

TEST(QvctlOutput, JsonInputKeepsIntegersAndRefusesNull) {
  auto value =
      qvctl::valueFromJsonText(R"({"i": 3, "u": 18446744073709551615, "r": 3.0, "s": "x"})");
  ASSERT_TRUE(value.ok());
  const Dictionary& d = *value.value().dictionary();
  EXPECT_EQ(d.get("i").type(), platform::ValueType::Integer);
  EXPECT_EQ(d.get("u").type(), platform::ValueType::Unsigned);
  EXPECT_EQ(d.get("r").type(), platform::ValueType::Real);
  EXPECT_EQ(d.keys(), (std::vector<std::string>{"i", "u", "r", "s"}));
  auto null = qvctl::valueFromJsonText(R"({"a": [1, null]})");
  ASSERT_FALSE(null.ok());
  EXPECT_NE(null.error().description().find("/a/1"), std::string::npos);
}

TEST(QvctlOutput, Base64MatchesTheStandardVectors) {
  const std::pair<const char*, const char*> cases[] = {
      {"", ""},
      {"f", "Zg=="},
      {"fo", "Zm8="},
      {"foo", "Zm9v"},
      {"foob", "Zm9vYg=="},
      {"fooba", "Zm9vYmE="},
      {"foobar", "Zm9vYmFy"},
  };
  for (const auto& [plain, encoded] : cases) {
    const std::string text(plain);
    EXPECT_EQ(qvctl::base64(platform::Data(text.begin(), text.end())), encoded) << plain;
  }
}

}  // namespace
