// The rules that ask the platform's types: the conformance operators and
// dictionary patterns through activation rules.
#include <vector>

#include "tests/unit/matching/MatchingTestSupport.h"

namespace matching_test {
namespace {

class TypeRulesTest : public MatchingTest {
 protected:
  void SetUp() override {
    MatchingTest::SetUp();
    fakes_.types->declare("com.example.child", {"com.example.parent"});
  }
};

// Which way round each operator asks; the walk of the hierarchy itself
// (chains, cycles, undeclared types) is the types layer's, tested there.
TEST_F(TypeRulesTest, ConformsAndIsOperators) {
  const auto p = make(plugInRecord("types"));
  struct Case {
    const char* value;
    const char* pattern;
    bool matches;
  };
  const std::vector<Case> cases = {
      {"com.example.child", "?KT-CONFORMS:com.example.parent", true},
      {"com.example.child", "?KT-IS:com.example.parent", false},
      {"com.example.parent", "?KT-IS:com.example.child", true},
      {"com.example.parent", "?KT-CONFORMS:com.example.child", false},
      {"com.example.child", "?KT-CONFORMS:", false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(p->matchValuePattern(c.value, c.pattern), c.matches) << c.value << " " << c.pattern;
  }
}

TEST_F(TypeRulesTest, MalformedPiecesNeverReachTheTypes) {
  const auto p = make(plugInRecord(
      "typed", Dictionary{{"XOExtensionContentTypes", Array{7, "com.example.child"}}}));
  const std::size_t before = fakes_.types->conformanceQuestions();
  EXPECT_FALSE(p->matchValuePattern("com.example.child", "?KT-SOMETHING:com.example.parent"));
  EXPECT_FALSE(p->matchValuePatterns("com.example.child", Array{1, Dictionary{}}));
  EXPECT_EQ(fakes_.types->conformanceQuestions(), before);
  // The list value's string element is asked; its number is not.
  EXPECT_TRUE(p->match(Dictionary{{"XOExtensionContentTypes", "?KT-CONFORMS:com.example.parent"}}));
  EXPECT_EQ(fakes_.types->conformanceQuestions(), before + 1);

  PlugInRecord r = plugInRecord("untyped");
  fakes_.registry->put(r);
  const auto withoutTypes =
      QVDPlugIn::initWithHVData(r, {fakes_.registry, fakes_.locale, fakes_.extensions});
  ASSERT_NE(withoutTypes, nullptr);
  EXPECT_FALSE(withoutTypes->matchValuePattern("a", "?KT-CONFORMS:a"));
  EXPECT_FALSE(withoutTypes->matchDictionaryPattern(Dictionary{{"image", true}}, Dictionary{}));
}

TEST_F(TypeRulesTest, DictionaryPatternsAreItemsForTheActivationRule) {
  const Dictionary rule{{"image", 2}, {"url", true}};
  const auto p = make(plugInRecord(
      "activation", Dictionary{{"XOExtensionActivationRule", rule},
                               {"TextRule", "SUBQUERY(extensionItems, $e, TRUE).@count > 0"}}));
  struct Case {
    const char* key;
    Dictionary items;
    bool matches;
  };
  const std::vector<Case> cases = {
      {"XOExtensionActivationRule", {{"image", 2}}, true},
      {"XOExtensionActivationRule", {{"image", 3}}, false},
      {"XOExtensionActivationRule", {{"url", 500}, {"image", 1}}, true},
      {"XOExtensionActivationRule", {{"movie", 1}}, false},
      {"XOExtensionActivationRule", {{"movie", 0}}, true},
      {"XOExtensionActivationRule", {{"image", "1"}}, false},
      {"XOExtensionActivationRule", {}, true},
      // A rule in text form is not supported; an absent rule is no rule.
      {"TextRule", {{"image", 1}}, false},
      {"NoRule", {}, false},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(p->match(Dictionary{{c.key, c.items}}), c.matches)
        << c.key << " " << Value(c.items).description();
  }
  EXPECT_TRUE(
      logged("evaluating XOExtension filter: " + Value(Dictionary{{"image", 2}}).description() +
                 " value: " + Value(rule).description(),
             Level::Debug, "extension"));
}

}  // namespace
}  // namespace matching_test
