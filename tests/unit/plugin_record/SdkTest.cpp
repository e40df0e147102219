#include "Quorvex/QVErrors.h"
#include "RecordTestSupport.h"
#include "platform/holvane/testing/FakeSdkRegistry.h"

namespace plugin_record_test {
namespace {

using platform::holvane::FakeSdkRegistry;

TEST(SdkMergeTest, PlugInWinsExceptCleanTimeoutAtEveryLevel) {
  struct Case {
    const char* what;
    Dictionary sdk, plugIn, want;
  } cases[] = {
      {"CleanTimeout from the SDK, Dedicated from the plug-in",
       {{"CleanTimeout", 30}, {"Dedicated", true}},
       {{"CleanTimeout", 5}, {"Dedicated", false}},
       {{"CleanTimeout", 30}, {"Dedicated", false}}},
      {"nested dictionaries merge key by key",
       {{"XOExtension", Dictionary{{"XOExtensionAttributes", Dictionary{{"a", 1}, {"b", 2}}}}}},
       {{"XOExtension", Dictionary{{"XOExtensionAttributes", Dictionary{{"b", 20}, {"c", 30}}}}}},
       {{"XOExtension",
         Dictionary{{"XOExtensionAttributes", Dictionary{{"b", 20}, {"c", 30}, {"a", 1}}}}}}},
      {"a dictionary does not replace a plug-in scalar",
       {{"k", Dictionary{{"x", 1}}}},
       {{"k", "scalar"}},
       {{"k", "scalar"}}},
      {"Shared merges as a set, nested too",
       {{"Shared", Array{"a", "b"}}, {"XOExtension", Dictionary{{"Shared", Array{"a", "b"}}}}},
       {{"Shared", Array{"b", "c"}}, {"XOExtension", Dictionary{{"Shared", Array{"b", "c"}}}}},
       {{"Shared", Array{"b", "c", "a"}},
        {"XOExtension", Dictionary{{"Shared", Array{"b", "c", "a"}}}}}},
      {"a Shared that is not a list keeps the plug-in's value",
       {{"Shared", Array{"a"}}, {"XOExtension", Dictionary{{"Shared", "sdk-only"}}}},
       {{"Shared", "."}, {"XOExtension", Dictionary{{"Shared", Array{"b"}}}}},
       {{"Shared", "."}, {"XOExtension", Dictionary{{"Shared", Array{"b"}}}}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    // Arrays compare in order, so the order of Shared entries is checked too.
    const Dictionary merged = QVPlugInCore::mergeDictionaryInto(c.sdk, c.plugIn);
    EXPECT_EQ(merged, c.want) << Value(merged).description();
  }
  EXPECT_TRUE(QVPlugInCore::sdkOverridesKey("CleanTimeout"));
  EXPECT_FALSE(QVPlugInCore::sdkOverridesKey("cleantimeout"));
}

using ResolveTest = RecordTest;

TEST_F(ResolveTest, MergesTheRegisteredSdk) {
  FakeSdkRegistry registry;
  registry.registerSdk(
      "com.example.point",
      {{"BXBundleDisplayName", "SDK name"},
       {"XOExtension", Dictionary{{"XOExtensionProtocol", "Proto"},
                                  {"CleanTimeout", 30},
                                  {"XOExtensionAttributes", Dictionary{{"fromSdk", 1}}}}}});
  auto record = recordAt(
      "/S/r", infoWith({{"XOExtensionPointIdentifier", "com.example.point"}, {"CleanTimeout", 5}},
                       {{"BXBundleDisplayName", "Mine"}}));
  ASSERT_TRUE(record);
  record->resolveSDK(registry);
  EXPECT_EQ(record->protocolSpec(), Value("Proto"));
  EXPECT_EQ(record->pluginKey("CleanTimeout"), Value(30));
  EXPECT_EQ(record->attribute("fromSdk"), Value(1));
  EXPECT_EQ(record->version(), Value("1"));
  EXPECT_EQ(record->bundleInfoDictionary()->get("BXBundleDisplayName"), Value("Mine"));
  EXPECT_TRUE(logged("-[QVPlugInCore resolveSDK] Mine merged with SDK", Level::Debug, "hv"));
  EXPECT_FALSE(record->diagnose());
}

TEST_F(ResolveTest, SdkProblemsAndRefusals) {
  FakeSdkRegistry registry;
  registry.failSdk("com.example.broken", platform::Error("test", 5, "disk on fire"));

  auto unregistered = recordAt("/S/u", infoWith({{"XOExtensionPointIdentifier", "com.nowhere"}}));
  ASSERT_TRUE(unregistered);
  unregistered->resolveSDK(registry);
  EXPECT_TRUE(logged("plug-in sdk \"com.nowhere\" not registered", Level::Default, "ops"));
  EXPECT_EQ(unregistered->version(), Value("1"));  // canonicalised all the same

  auto broken = recordAt("/S/b", infoWith({{"XOExtensionPointIdentifier", "com.example.broken"}}));
  ASSERT_TRUE(broken);
  broken->resolveSDK(registry);
  EXPECT_TRUE(loggedAnything("disk on fire"));
  EXPECT_EQ(broken->version(), Value("1"));

  auto invalid = recordAt("/S/i", infoWith({{"XOExtensionPointIdentifier", 42}}));
  ASSERT_TRUE(invalid);
  const auto before = invalid->plugInDictionary();
  invalid->resolveSDK(registry);
  EXPECT_TRUE(logged("invalid SDK key:42", Level::Error, "ops"));
  EXPECT_EQ(invalid->plugInDictionary(), before);  // not even canonicalised

  auto bare = QVPlugInCore::initWithName("b", url("/S/bare"), Value(), Dictionary{}, std::nullopt);
  ASSERT_TRUE(bare);
  bare->resolveSDK(registry);
  EXPECT_TRUE(logged("cannot resolve SDK without materialized Info.vmap", Level::Fault, "ops"));
  EXPECT_EQ(*bare->plugInDictionary(), Dictionary{});
}

TEST(DiagnoseTest, FirstFailingCheckDecides) {
  const Dictionary attrs{{"XOExtensionVersion", "1"}};
  struct Case {
    const char* what;
    const char* path;
    Dictionary plugIn;
    const char* want;  // null: acceptable
  } cases[] = {
      // clang-format off
      {"complete", "/S/ok", {{"XOExtensionProtocol", "P"}, {"XOExtensionAttributes", attrs}},
       nullptr},
      {"no protocol", "/S/np", {{"XOExtensionAttributes", attrs}},
       "missing \"XOExtensionProtocol\" key in Info.vmap or SDK"},
      {"protocol checked before attributes", "/S/nn", {},
       "missing \"XOExtensionProtocol\" key in Info.vmap or SDK"},
      {"app extension naming a class", "/A.app/PlugIns/e.ovx",
       {{"XOExtensionAttributes", attrs}, {"PrincipalClass", "Mine"}},
       "Application Extensions may not use the \"PrincipalClass\" key"},
      {"PassProxy before EmbeddedCode", "/S/pe", {{"XOExtensionProtocol", "P"},
       {"XOExtensionAttributes", attrs}, {"PassProxy", false}, {"EmbeddedCode", "x"}},
       "the \"PassProxy\" key is not supported on this platform"},
      // clang-format on
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    auto record = recordAt(c.path, infoWith(c.plugIn));
    ASSERT_TRUE(record);
    std::optional<platform::Error> error = record->diagnose();
    if (c.want == nullptr) {
      EXPECT_FALSE(error) << (error ? error->description() : "");
      continue;
    }
    ASSERT_TRUE(error);
    EXPECT_TRUE(QVErrorIs(*error, QVErrorInvalidPlugIn));
    EXPECT_EQ(error->description(), c.want);
  }
  auto unnamed = recordAt("/S/x", infoWith({{"XOExtensionProtocol", "P"}}));
  unnamed->setIdentifier(std::nullopt);
  ASSERT_TRUE(unnamed->diagnose());
  EXPECT_EQ(unnamed->diagnose()->description(),
            "missing identifier (no XOExtensionIdentifier, nor even BXBundleIdentifier)");
}

}  // namespace
}  // namespace plugin_record_test
