#include <unordered_set>

#include "RecordTestSupport.h"

namespace plugin_record_test {
namespace {

const platform::Uuid kA = *platform::Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F");
const platform::Uuid kB = *platform::Uuid::parse("0B2D7C51-2F0E-4C1A-8F36-8C1D2E3F4A5B");

using IdentityTest = RecordTest;

TEST_F(IdentityTest, UuidAloneDecides) {
  const Dictionary info = infoWith({{"XOExtensionAttributes", Dictionary{}}});
  auto first = QVPlugInCore::initWithName("one", url("/A.app/PlugIns/one.ovx"), Value(info),
                                          std::nullopt, kA);
  auto renamed =
      QVPlugInCore::initWithName("two", url("/B.app/PlugIns/two.ovx"), Value(), std::nullopt, kA);
  auto sameName = QVPlugInCore::initWithName("one", url("/A.app/PlugIns/one.ovx"), Value(info),
                                             std::nullopt, kB);
  ASSERT_TRUE(first && renamed && sameName);

  EXPECT_TRUE(first->isEqual(renamed.get()));
  EXPECT_TRUE(*first == *renamed);
  EXPECT_EQ(first->hash(), renamed->hash());
  EXPECT_FALSE(first->isEqual(sameName.get()));
  EXPECT_FALSE(first->isEqual(nullptr));
  // A record that was never set up stands for no plug-in.
  auto empty = QVPlugInCore::init();
  EXPECT_FALSE(empty->isEqual(first.get()));
  EXPECT_TRUE(empty->isEqual(empty.get()));

  std::unordered_set<std::shared_ptr<QVPlugInCore>, QVPlugInCoreHash, QVPlugInCoreEqual> set;
  EXPECT_TRUE(set.insert(first).second);
  EXPECT_FALSE(set.insert(renamed).second);
  EXPECT_TRUE(set.insert(sameName).second);
  EXPECT_EQ(set.size(), 2u);
  EXPECT_EQ(set.count(renamed), 1u);
  EXPECT_EQ(std::hash<QVPlugInCore>()(*first), first->hash());
}

using ConstructionTest = RecordTest;

TEST_F(ConstructionTest, WhereThePlugInDictionaryComesFrom) {
  const Dictionary fromInfo{{"XOExtensionPointIdentifier", "com.example.point"}};
  const Dictionary argument{{"XOExtensionPointIdentifier", "from.argument"}};

  auto withInfo = QVPlugInCore::initWithName("p", url("/S/p"), Value(infoWith(fromInfo)), argument,
                                             std::nullopt);
  ASSERT_TRUE(withInfo);
  EXPECT_EQ(*withInfo->plugInDictionary(), fromInfo);
  EXPECT_EQ(*withInfo->bundleInfoDictionary(), infoWith(fromInfo));

  auto withoutInfo = QVPlugInCore::initWithName("p", url("/S/p"), Value(), argument, kA);
  ASSERT_TRUE(withoutInfo);
  EXPECT_EQ(*withoutInfo->plugInDictionary(), argument);
  EXPECT_FALSE(withoutInfo->bundleInfoDictionary());
  EXPECT_EQ(withoutInfo->uuid(), kA);
  EXPECT_EQ(withoutInfo->identifier(), "p");

  auto neither = QVPlugInCore::initWithName("p", url("/S/p"), Value(), std::nullopt, kA);
  ASSERT_TRUE(neither);
  EXPECT_FALSE(neither->plugInDictionary());
  EXPECT_TRUE(neither->pluginKey("XOExtensionPointIdentifier").isNone());
}

TEST_F(ConstructionTest, RefusalsAndTheirMessages) {
  struct Case {
    const char* what;
    std::optional<std::string> name;
    std::optional<std::string> location;
    Value info;
    const char* message;  // null: nothing may be logged
    Level level;
  } cases[] = {
      {"no url", "p", std::nullopt, Value(infoWith({})), nullptr, Level::Default},
      {"no name", std::nullopt, url("/S/x y.ovx"), Value(infoWith({})),
       "missing identifier in plug-in at /S/x y.ovx", Level::Error},
      {"XOExtension is a string", "p", url("/S/p"), Value(Dictionary{{"XOExtension", "nope"}}),
       "malformed plug-in dictionary in plug-in p at file:///S/p: ", Level::Default},
      {"info is not a dictionary", "p", url("/S/p"), Value("text"),
       "malformed plug-in dictionary in plug-in p at file:///S/p: text", Level::Default},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    clearLog();
    EXPECT_FALSE(QVPlugInCore::initWithName(c.name, c.location, c.info, Dictionary{}, kA));
    if (c.message == nullptr) {
      EXPECT_EQ(capture_->size(), 0u);
    } else {
      EXPECT_TRUE(loggedStartingWith(c.message, c.level, "ops"))
          << ::testing::PrintToString(capture_->messages());
    }
  }
}

TEST_F(ConstructionTest, MultipleIsObsoleteButAccepted) {
  auto record = recordAt("/S/m", infoWith({{"Multiple", true}}));
  ASSERT_TRUE(record);
  EXPECT_TRUE(
      logged("multiplexed plug-ins (Multiple key) obsolete and ignored", Level::Default, "ops"));
  EXPECT_FALSE(record->isMultiplexed());
}

TEST_F(ConstructionTest, SetupLogsTheDisplayName) {
  auto record = recordAt("/S/d", infoWith({}, {{"BXBundleDisplayName", "Shown"}}));
  ASSERT_TRUE(record);
  EXPECT_TRUE(
      logged("-[QVPlugInCore setupWithName:url:bundleInfo:info:uuid:] Shown", Level::Debug, "hv"));
  EXPECT_TRUE(logged("-[QVPlugInCore setDictionaries:] Shown", Level::Debug, "ops"));
  clearLog();
  record->infoKey("BXBundleDisplayName");
  EXPECT_TRUE(logged("-[QVPlugInCore infoKey:] BXBundleDisplayName => Shown", Level::Debug, "hv"));
}

using DerivedTest = RecordTest;

TEST_F(DerivedTest, PropertiesFollowTheManifest) {
  const Value none;
  const Value object("XOObject");
  // flags: A application extension, H hybrid, D dedicated, T data plug-in.
  struct Case {
    const char* what;
    const char* path;
    Dictionary plugIn;
    Value protocol, principal, embedded;
    std::string flags;
  } cases[] = {
      // clang-format off
      {"app extension defaults", "/A.app/PlugIns/e.ovx", {}, object, object, object, "A"},
      {"plain plug-in without keys", "/System/Library/PlugIns/p.plugin", {}, none, none, none, ""},
      {"suffix is case-sensitive", "/A.app/PlugIns/e.OVX", {}, none, none, none, ""},
      {"data plug-in", "/S/d", {{"XOExtensionProtocol", "#Data"}},
       Value("#Data"), none, Value("#Data"), "T"},
      {"compound protocol", "/S/c", {{"XOExtensionProtocol", Array{"P1", "P2"}},
                                     {"PrincipalClass", "Main"}, {"EmbeddedProtocol", "E"}},
       Value(Array{"P1", "P2"}), Value("Main"), Value("E"), ""},
      {"EmbeddedCode false is still hybrid", "/S/h", {{"EmbeddedCode", false}}, none, none, none, "H"},
      {"Dedicated false", "/S/f", {{"Dedicated", false}}, none, none, none, ""},
      {"Dedicated true", "/S/t", {{"Dedicated", true}}, none, none, none, "D"},
      // clang-format on
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    auto record = recordAt(c.path, infoWith(c.plugIn));
    ASSERT_TRUE(record);
    EXPECT_EQ(record->path(), c.path);
    EXPECT_EQ(record->protocolSpec(), c.protocol);
    EXPECT_EQ(record->principalSpec(), c.principal);
    EXPECT_EQ(record->embeddedProtocolSpec(), c.embedded);
    std::string flags;
    if (record->isAppExtension()) flags += 'A';
    if (record->isHybrid()) flags += 'H';
    if (record->isDedicated()) flags += 'D';
    if (record->isData()) flags += 'T';
    EXPECT_EQ(flags, c.flags);
    EXPECT_FALSE(record->embeddedCodePath());
  }
}

TEST_F(DerivedTest, AttributesThatAreNotADictionaryCountAsNone) {
  auto odd = recordAt("/S/o", infoWith({{"XOExtensionAttributes", "flat"}}));
  ASSERT_TRUE(odd);
  EXPECT_TRUE(odd->attributes().isNone());
  EXPECT_TRUE(odd->version().isNone());
  EXPECT_TRUE(odd->diagnose());
}

TEST_F(DerivedTest, OldStyle) {
  auto current = recordAt("/S/n", infoWith({}, {{"Quorvex", true}}));
  ASSERT_TRUE(current);
  EXPECT_FALSE(current->oldStyle());  // "XOExtension" decides even beside "Quorvex"

  auto old = QVPlugInCore::init();
  old->setBundleInfoDictionary(Dictionary{{"Quorvex", Dictionary{}}});
  EXPECT_TRUE(old->oldStyle());
  EXPECT_FALSE(loggedAnything("unknown plug-in configuration style"));

  auto neither = QVPlugInCore::init();
  neither->setBundleInfoDictionary(Dictionary{{"BXBundleName", "n"}});
  EXPECT_TRUE(neither->oldStyle());
  EXPECT_TRUE(logged("unknown plug-in configuration style", Level::Fault, "ops"));
}

TEST_F(DerivedTest, AnnotationChangesReplaceTheDictionary) {
  auto record = QVPlugInCore::init();
  record->setAnnotationValue("election", 1);  // no annotations yet: starts from empty
  ASSERT_TRUE(record->annotations());
  EXPECT_EQ(*record->annotations(), (Dictionary{{"election", 1}}));

  record->setAnnotationValue("extension", Dictionary{{"k", "v"}});
  const auto before = record->annotations();
  record->setAnnotationValue("election", Value());
  EXPECT_EQ(*record->annotations(), (Dictionary{{"extension", Dictionary{{"k", "v"}}}}));
  // Whoever read the previous dictionary still holds it unchanged.
  EXPECT_EQ(*before, (Dictionary{{"election", 1}, {"extension", Dictionary{{"k", "v"}}}}));
}

}  // namespace
}  // namespace plugin_record_test
