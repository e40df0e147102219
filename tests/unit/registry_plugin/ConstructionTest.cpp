// Building a plug-in from a registration record: validation, entitlements,
// the hub protocol version and the annotation key.
#include "tests/unit/registry_plugin/RegistryPlugInTestSupport.h"

namespace registry_plugin_test {
namespace {

TEST_F(RegistryPlugInTest, ValidationOfLocationAndContainer) {
  const std::string kLocation = "plug-ins outside containing apps must be in /System";
  const std::string kContainer = "this plug-in has no sandbox data container";
  auto refused = [&](PlugInRecord r, const std::string& problem) {
    capture_->clear();
    EXPECT_EQ(make(r), nullptr) << r.path;
    EXPECT_TRUE(logged("ignoring mis-configured plug-in at " + r.path + ": " + problem,
                       Level::Info, "ops"))
        << r.path;
  };
  refused(record("Systemic/A.plugin"), kLocation);  // no slash: not the system volume
  PlugInRecord noContainer = record("opt/A.plugin");
  noContainer.dataContainer.reset();
  refused(noContainer, kContainer);  // the container message wins over the location

  PlugInRecord inApp = record("Applications/A.app/PlugIns/A.ovx");
  inApp.containingApplicationPath = root_ + "/Applications/A.app";
  EXPECT_NE(make(inApp), nullptr);
  PlugInRecord data = record("System/Library/PlugIns/D.plugin", "com.example.d",
                             validPlugInDictionary("#Data"));
  data.dataContainer.reset();
  EXPECT_NE(make(data), nullptr) << "a data plug-in needs no container";
}

TEST_F(RegistryPlugInTest, UnusableRecordsGiveNoPlugIn) {
  PlugInRecord noIdentifier = record("System/B.plugin");
  noIdentifier.identifier.clear();
  EXPECT_EQ(make(noIdentifier), nullptr);
  EXPECT_TRUE(logged("missing identifier in plug-in at " + noIdentifier.path, Level::Error, "ops"));
  EXPECT_EQ(make(record("System/C.plugin", "c", Dictionary{{"XOExtensionProtocol", "p"}})),
            nullptr);
}

TEST_F(RegistryPlugInTest, HubProtocolVersion) {
  Dictionary stated = validPlugInDictionary();
  stated.set("HubProtocolVersion", 3);
  PlugInRecord r = record("System/H.plugin", "com.example.h", stated);
  r.info.set("Quorvex", Dictionary{});
  EXPECT_EQ(make(r)->hubProtocolVersion(), 3u) << "stated wins over the old style";
  r.info.set("XOExtension", validPlugInDictionary());
  EXPECT_EQ(make(r)->hubProtocolVersion(), 1u) << "old style";
  EXPECT_EQ(make(record("System/N.plugin"))->hubProtocolVersion(), 2u) << "neither";
}

TEST_F(RegistryPlugInTest, EntitlementsAndAnnotationKey) {
  PlugInRecord r = record("System/E.plugin", "com.example.mine");
  r.entitlements = Dictionary{{"false", false}, {"zero", 0}, {"one", 1},
                              {"text", "anything"}, {"list", Array{}}};
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  for (const char* key : {"false", "zero", "absent"}) EXPECT_FALSE(plugIn->hasEntitlement(key)) << key;
  for (const char* key : {"one", "text", "list"}) EXPECT_TRUE(plugIn->hasEntitlement(key)) << key;

  const std::string replace(qvd::QVDReplacePlugInEntitlement);
  r.entitlements = Dictionary{{replace, "com.other"}};
  EXPECT_EQ(make(r)->annotationKey(), "com.other");
  r.entitlements = Dictionary{{replace, Array{"com.other"}}};
  EXPECT_EQ(make(r)->annotationKey(), "com.example.mine") << "a list does not count";
}

TEST_F(RegistryPlugInTest, PrunedInfoDictionaryDropsOnlyDTKeys) {
  const Dictionary info{{"DTSDKName", "x"}, {"DT", 1}, {"dtLower", 2}, {"D", 3}};
  EXPECT_EQ(QVDPlugIn::prunedInfoDictionaryFor(info), (Dictionary{{"dtLower", 2}, {"D", 3}}));
}

}  // namespace
}  // namespace registry_plugin_test
