// Building a plug-in from a registration record: the fields it takes, the
// validation that refuses it, entitlements and the annotation key.
#include "tests/unit/registry_plugin/RegistryPlugInTestSupport.h"

#include "Quorvex/QVFileURL.h"

namespace registry_plugin_test {
namespace {

TEST_F(RegistryPlugInTest, ValidationOfLocationAndContainer) {
  enum class Container { Present, Absent };
  enum class Protocol { Service, Data };
  struct Case {
    const char* what;
    const char* relative;
    const char* containingApp;  // relative to the root, or null
    Protocol protocol;
    Container container;
    const char* problem;  // null: accepted
  };
  const char* kLocation = "plug-ins outside containing apps must be in /System";
  const char* kContainer = "this plug-in has no sandbox data container";
  const std::vector<Case> cases = {
      {"on the system volume", "System/Library/PlugIns/A.plugin", nullptr, Protocol::Service,
       Container::Present, nullptr},
      {"a prefix without the slash is not the system volume", "Systemic/A.plugin", nullptr,
       Protocol::Service, Container::Present, kLocation},
      {"elsewhere without an application", "opt/A.plugin", nullptr, Protocol::Service,
       Container::Present, kLocation},
      {"inside an application", "Applications/A.app/PlugIns/A.ovx", "Applications/A.app",
       Protocol::Service, Container::Present, nullptr},
      {"a data plug-in needs no container", "System/Library/PlugIns/D.plugin", nullptr,
       Protocol::Data, Container::Absent, nullptr},
      {"others do", "System/Library/PlugIns/A.plugin", nullptr, Protocol::Service,
       Container::Absent, kContainer},
      {"the container message wins over the location", "opt/A.plugin", nullptr, Protocol::Service,
       Container::Absent, kContainer},
  };
  for (const Case& c : cases) {
    capture_->clear();
    PlugInRecord r = record(c.relative, "com.example.plugin",
                            validPlugInDictionary(c.protocol == Protocol::Data ? "#Data" : "p"));
    if (c.containingApp) r.containingApplicationPath = root_ + "/" + c.containingApp;
    if (c.container == Container::Absent) r.dataContainer.reset();
    std::shared_ptr<QVDPlugIn> plugIn = make(r);
    if (c.problem == nullptr) {
      EXPECT_NE(plugIn, nullptr) << c.what;
    } else {
      EXPECT_EQ(plugIn, nullptr) << c.what;
      EXPECT_TRUE(logged("ignoring mis-configured plug-in at " + r.path + ": " + c.problem,
                         Level::Info, "ops"))
          << c.what;
    }
  }
}

TEST_F(RegistryPlugInTest, UnusableRecordsGiveNoPlugIn) {
  PlugInRecord noPath = record("System/A.plugin");
  noPath.path.clear();
  EXPECT_EQ(QVDPlugIn::initWithHVData(noPath, services()), nullptr);
  PlugInRecord noIdentifier = record("System/B.plugin");
  noIdentifier.identifier.clear();
  EXPECT_EQ(make(noIdentifier), nullptr);
  EXPECT_TRUE(logged("missing identifier in plug-in at " + noIdentifier.path, Level::Error, "ops"));
  // A manifest the base validation refuses.
  EXPECT_EQ(make(record("System/C.plugin", "c", Dictionary{{"XOExtensionProtocol", "p"}})),
            nullptr);
}

TEST_F(RegistryPlugInTest, FieldsTakenFromTheRecord) {
  PlugInRecord r = record("Applications/A.app/PlugIns/P.ovx", "com.example.p");
  r.originalIdentifier = "com.example.first";
  r.containingApplicationPath = root_ + "/Applications/A.app";
  r.registered = platform::Date{1700000000.9};
  r.volume = platform::holvane::Volume::System;
  r.entitlements = Dictionary{{"x", true}};
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(plugIn->originalIdentifier(), "com.example.first");
  EXPECT_EQ(plugIn->containingPath(), root_ + "/Applications/A.app");
  EXPECT_EQ(plugIn->dataContainerURL(), QVFileURLFromPath(*r.dataContainer));
  EXPECT_EQ(plugIn->lastModified(), 1700000000);
  EXPECT_TRUE(plugIn->onSystemVolume());
  ASSERT_NE(plugIn->entitlements(), nullptr);
  EXPECT_EQ(*plugIn->entitlements(), (Dictionary{{"x", true}}));
  ASSERT_NE(plugIn->bundleInfoDictionary(), nullptr);
  EXPECT_EQ(*plugIn->bundleInfoDictionary(), r.info);

  // Dates before the epoch are cut toward zero too.
  PlugInRecord early = record("System/E.plugin", "com.example.e");
  early.registered = platform::Date{-1.5};
  std::shared_ptr<QVDPlugIn> earlyPlugIn = make(early);
  ASSERT_NE(earlyPlugIn, nullptr);
  EXPECT_EQ(earlyPlugIn->lastModified(), -1);
}

TEST_F(RegistryPlugInTest, HubProtocolVersion) {
  struct Case {
    const char* what;
    Value hubVersion;  // in the registry plug-in dictionary
    bool oldStyleKey;  // "Quorvex" in the info dictionary
    std::uint32_t expected;
  };
  const std::vector<Case> cases = {
      {"stated", Value(3), false, 3},
      {"stated wins over the old style", Value(3), true, 3},
      {"old style", Value(), true, 1},
      {"neither", Value(), false, 2},
  };
  for (const Case& c : cases) {
    Dictionary pd = validPlugInDictionary();
    if (!c.hubVersion.isNone()) pd.set("HubProtocolVersion", c.hubVersion);
    PlugInRecord r = record("System/H.plugin", "com.example.h", pd);
    if (c.oldStyleKey) r.info.set("Quorvex", Dictionary{});
    std::shared_ptr<QVDPlugIn> plugIn = make(r);
    ASSERT_NE(plugIn, nullptr) << c.what;
    EXPECT_EQ(plugIn->hubProtocolVersion(), c.expected) << c.what;
  }
}

TEST_F(RegistryPlugInTest, EntitlementsAndAnnotationKey) {
  PlugInRecord r = record("System/E.plugin", "com.example.mine");
  r.entitlements = Dictionary{{"false", false}, {"zero", 0},          {"true", true},
                              {"one", 1},       {"text", "anything"}, {"list", Array{}}};
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  const std::vector<std::pair<const char*, bool>> held = {
      {"false", false}, {"zero", false}, {"absent", false}, {"true", true},
      {"one", true},    {"text", true},  {"list", true}};
  for (const auto& [key, expected] : held) EXPECT_EQ(plugIn->hasEntitlement(key), expected) << key;
  EXPECT_EQ(plugIn->valueForEntitlement("text"), Value("anything"));
  EXPECT_TRUE(plugIn->valueForEntitlement("absent").isNone());

  struct Case {
    const char* what;
    std::optional<Dictionary> entitlements;
    std::string key;
  };
  const std::vector<Case> cases = {
      {"replacing another plug-in",
       Dictionary{{std::string(qvd::QVDReplacePlugInEntitlement), "com.other"}}, "com.other"},
      {"a list does not count",
       Dictionary{{std::string(qvd::QVDReplacePlugInEntitlement), Array{"com.other"}}},
       "com.example.mine"},
      {"no entitlements at all", std::nullopt, "com.example.mine"},
  };
  for (const Case& c : cases) {
    r.entitlements = c.entitlements;
    std::shared_ptr<QVDPlugIn> p = make(r);
    ASSERT_NE(p, nullptr) << c.what;
    EXPECT_EQ(p->annotationKey(), c.key) << c.what;
  }
}

TEST_F(RegistryPlugInTest, PrunedInfoDictionaryDropsOnlyDTKeys) {
  const Dictionary info{
      {"DTSDKName", "x"}, {"DT", 1}, {"dtLower", 2}, {"BXBundleName", "n"}, {"D", 3}};
  EXPECT_EQ(QVDPlugIn::prunedInfoDictionaryFor(info),
            (Dictionary{{"dtLower", 2}, {"BXBundleName", "n"}, {"D", 3}}));
}

}  // namespace
}  // namespace registry_plugin_test
