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
}

using ConstructionTest = RecordTest;

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
      {"suffix is case-sensitive", "/A.app/PlugIns/e.OVX", {}, none, none, none, ""},
      {"data plug-in", "/S/d", {{"XOExtensionProtocol", "#Data"}},
       Value("#Data"), none, Value("#Data"), "T"},
      {"compound protocol", "/S/c", {{"XOExtensionProtocol", Array{"P1", "P2"}},
                                     {"PrincipalClass", "Main"}, {"EmbeddedProtocol", "E"}},
       Value(Array{"P1", "P2"}), Value("Main"), Value("E"), ""},
      {"EmbeddedCode false is still hybrid", "/S/h", {{"EmbeddedCode", false}}, none, none, none, "H"},
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

}  // namespace
}  // namespace plugin_record_test
