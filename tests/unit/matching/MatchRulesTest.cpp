// Rule sets against plug-ins: which property each key reads, the truth
// patterns, the string operators and their order, list values, entitlement
// keys and the containing application.
#include <vector>

#include "tests/unit/matching/MatchingTestSupport.h"

namespace matching_test {
namespace {

TEST_F(MatchingTest, IdentifierRulesAndRuleSets) {
  const auto a = make(plugInRecord("a"));
  const auto b = make(plugInRecord("b"));
  const std::string uuidOfA = a->uuid()->toString();
  struct Case {
    std::optional<Dictionary> rules;
    bool matchesA, matchesB;
  };
  const std::vector<Case> cases = {
      {std::nullopt, true, true},
      {Dictionary{}, true, true},
      {Dictionary{{"XOExtensionIdentifier", "com.example.a"}}, true, false},
      {Dictionary{{"XOExtensionIdentifier", Array{"com.example.a", "com.example.b"}}}, true, true},
      {Dictionary{{"XOExtensionIdentifier", "<>com.example.a"}}, false, true},
      // Entries of a pattern list that are not strings never match.
      {Dictionary{{"XOExtensionIdentifier", Array{1, Array{"com.example.a"}, "com.example.b"}}},
       false, true},
      {Dictionary{{"XOExtensionIdentifier", 5}}, false, false},
      {Dictionary{{"com.corvane.uuid", uuidOfA}}, true, false},
      // Every entry must match.
      {Dictionary{{"XOExtensionIdentifier", "com.example.a"}, {"XOExtensionVersion", "2"}}, false,
       false},
      {Dictionary{{"XOExtensionIdentifier", "com.example.a"}, {"XOExtensionVersion", "1"}}, true,
       false},
  };
  for (const Case& c : cases) {
    const std::string label = c.rules ? Value(*c.rules).description() : "none";
    EXPECT_EQ(a->match(c.rules), c.matchesA) << label;
    EXPECT_EQ(b->match(c.rules), c.matchesB) << label;
  }
}

TEST_F(MatchingTest, OperatorsComparisonAndTheirOrder) {
  const auto p = make(plugInRecord("ops"));
  struct Case {
    const char* value;
    const char* pattern;
    bool matches;
  };
  const std::vector<Case> cases = {
      // Digit runs compare by value.
      {"2.9", ">=2.10", false}, {"2.10", ">=2.10", true}, {"3", ">=2.10", true},
      {"9", "<10", true}, {"10", ">9", true}, {"10", "<=10", true}, {"11", "<=10", false},
      {"1.01", "1.1", true}, {"1.0", "<1.0.1", true}, {"a", "A", false}, {"b", ">a", true},
      // "<>x" is inequality with "x", not "less than >x".
      {"x", "<>x", false}, {"y", "<>x", true}, {">x", "<>x", true},
      // "==1" is equality with "=1"; "=<5" equality with "<5"; "=" with "".
      {"=1", "==1", true}, {"1", "==1", false},
      {"<5", "=<5", true}, {"4", "=<5", false},
      {"", "=", true}, {"a", "=", false},
      {"", "", true}, {"a", "", false},
      // An operator that is not known matches nothing, not even itself.
      {"?KT-SOMETHING:x", "?KT-SOMETHING:x", false}, {"x", "?", false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(p->matchValuePattern(c.value, c.pattern), c.matches)
        << '"' << c.value << "\" against \"" << c.pattern << '"';
  }
  EXPECT_TRUE(logged("unrecognized match operator:?KT-SOMETHING:x", Level::Info, "ops"));
  EXPECT_TRUE(p->match(Dictionary{{"XOExtensionVersion", Array{">=2", "<=1"}}}));
  EXPECT_FALSE(p->match(Dictionary{{"XOExtensionVersion", ">=2.10"}}));
}

TEST_F(MatchingTest, TruthPatterns) {
  const auto set = make(plugInRecord("set", Dictionary{{"SomeKey", "yes"}}));
  const auto inInfo = make(plugInRecord("info", {}, Dictionary{{"SomeKey", Array{}}}));
  const auto isFalse = make(plugInRecord("false", Dictionary{{"SomeKey", false}}));
  const auto isZero = make(plugInRecord("zero", Dictionary{{"SomeKey", 0}}));
  const auto absent = make(plugInRecord("absent"));
  struct Case {
    std::shared_ptr<QVDPlugIn> plugIn;
    bool matchesTrue;
  };
  const std::vector<Case> cases = {
      {set, true}, {inInfo, true}, {isFalse, false}, {isZero, false}, {absent, false}};
  for (const Case& c : cases) {
    const std::string label = c.plugIn->identifier().value_or("?");
    EXPECT_EQ(c.plugIn->matchKeyPattern("SomeKey", true), c.matchesTrue) << label;
    EXPECT_EQ(c.plugIn->matchKeyPattern("SomeKey", false), !c.matchesTrue) << label;
    // Property-list equality: the numbers 1 and 0 are the booleans.
    EXPECT_EQ(c.plugIn->matchKeyPattern("SomeKey", 1), c.matchesTrue) << label;
    EXPECT_EQ(c.plugIn->matchKeyPattern("SomeKey", 0), !c.matchesTrue) << label;
  }
  // A present value that is neither true nor false only meets string patterns.
  EXPECT_FALSE(set->matchKeyPattern("SomeKey", "no"));
  EXPECT_TRUE(set->matchKeyPattern("SomeKey", "yes"));
  EXPECT_FALSE(absent->matchKeyPattern("SomeKey", "<>anything")) << "an absent value never matches";
}

TEST_F(MatchingTest, ContainingApplicationFailsWithoutOneWhateverThePattern) {
  const auto loose = make(plugInRecord("loose"));
  PlugInRecord inApp = plugInRecord("inapp");
  inApp.containingApplicationPath = platform::rootPath("Applications/Host.app");
  const auto contained = make(inApp);
  EXPECT_FALSE(loose->match(Dictionary{{"XOExtensionContainingApp", false}}));
  EXPECT_FALSE(loose->match(Dictionary{{"XOExtensionContainingApp", "<>/nowhere"}}));
  EXPECT_TRUE(loose->match(Dictionary{{"SomeAbsentKey", false}}));
  EXPECT_TRUE(contained->match(Dictionary{{"XOExtensionContainingApp", *inApp.containingApplicationPath}}));
  EXPECT_FALSE(contained->match(Dictionary{{"XOExtensionContainingApp", false}}));
}

TEST_F(MatchingTest, EntitlementKeysReadOnlyEntitlements) {
  const std::string key = "ENTITLEMENT:com.example.flag";
  // A manifest value under the same key must not stand in for the entitlement.
  PlugInRecord r = plugInRecord("ent", Dictionary{{key, true}}, Dictionary{{key, true}});
  struct Case {
    std::optional<Dictionary> entitlements;
    Value pattern;
    bool matches;
  };
  const std::vector<Case> cases = {
      {Dictionary{{"com.example.flag", true}}, true, true},
      {Dictionary{{"com.example.flag", "level-2"}}, true, true},
      {Dictionary{{"com.example.flag", "level-2"}}, ">=level-10", false},
      {Dictionary{{"com.example.flag", false}}, true, false},
      {Dictionary{}, true, false},
      {std::nullopt, true, false},
      {std::nullopt, false, true},
  };
  for (const Case& c : cases) {
    r.entitlements = c.entitlements;
    EXPECT_EQ(make(r)->matchKeyPattern(key, c.pattern), c.matches)
        << (c.entitlements ? Value(*c.entitlements).description() : "none") << " "
        << c.pattern.description();
  }
}

TEST_F(MatchingTest, ListValuedProperties) {
  const auto p = make(plugInRecord(
      "list", Dictionary{{"Kinds", Array{"a", "b"}}, {"Mixed", Array{7, Array{"c"}, "d"}}}));
  struct Case {
    const char* key;
    Value pattern;
    bool matches;
  };
  const std::vector<Case> cases = {
      {"Kinds", "b", true}, {"Kinds", "c", false}, {"Kinds", Array{"x", "a"}, true},
      {"Kinds", "<>a", true},  // "b" differs from "a"
      // Elements that are not strings are neither compared nor nested into.
      {"Mixed", "7", false}, {"Mixed", "c", false}, {"Mixed", "d", true},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(p->matchKeyPattern(c.key, c.pattern), c.matches)
        << c.key << " " << c.pattern.description();
  }
  EXPECT_FALSE(p->matchValuePatterns(Value(Array{"b"}), "b")) << "only a string value";
}

}  // namespace
}  // namespace matching_test
