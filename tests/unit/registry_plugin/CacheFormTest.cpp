// The caches that follow the registration generation, the localized names
// and Stowage titles, and the tokens added to a plug-in form.
#include <cerrno>

#include "Quorvex/QVFileURL.h"

#include "tests/unit/registry_plugin/RegistryPlugInTestSupport.h"

namespace registry_plugin_test {
namespace {

TEST_F(RegistryPlugInTest, NamesAreKeptUntilTheGenerationChanges) {
  PlugInRecord r = record("Applications/A.app/PlugIns/P.ovx", "com.example.p");
  r.containingApplicationPath = root_ + "/Applications/A.app";
  r.info.set("BXBundleName", "Plain");
  writeTable(r.path, "en", "InfoPlist", Dictionary{{"BXBundleDisplayName", "Shown"}});
  writeTable(r.path, "de", "InfoPlist", Dictionary{{"BXBundleDisplayName", "Gezeigt"}});
  platform::holvane::ApplicationRecord app;
  app.path = *r.containingApplicationPath;
  app.info = Dictionary{{"BXBundleName", "App"}};
  registry_->putApplication(app);
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);

  EXPECT_EQ(plugIn->localizedName(), "Shown");
  EXPECT_EQ(plugIn->localizedShortName(), "Plain");
  EXPECT_EQ(plugIn->localizedContainingName(), "App");
  const std::size_t lookups = registry_->lookupCount();
  EXPECT_EQ(plugIn->localizedName(), "Shown");
  EXPECT_EQ(plugIn->localizedShortName(), "Plain");
  (void)plugIn->bundleInfoDictionary();
  EXPECT_EQ(registry_->lookupCount(), lookups) << "unchanged generation, no lookup";

  // A change to the registration database (here: a new record elsewhere)
  // makes the next read ask again, and pick up what changed meanwhile.
  locale_->setLocale("de_DE");
  registry_->put(record("System/Other.plugin", "com.example.other"));
  EXPECT_EQ(plugIn->localizedName(), "Gezeigt");
  EXPECT_GT(registry_->lookupCount(), lookups);
}

TEST_F(RegistryPlugInTest, InfoDictionaryFollowsTheCurrentRecord) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_TRUE(plugIn->pluginKey("Shared").isNone());
  Dictionary pd = validPlugInDictionary("p");
  pd.set("Shared", "Resources");
  r.info.set("XOExtension", pd);
  registry_->put(r);
  EXPECT_EQ(plugIn->pluginKey("Shared"), Value("Resources"));
  EXPECT_EQ(plugIn->protocolSpec(), Value("p"));
}

TEST_F(RegistryPlugInTest, FallsBackToThePathWhenTheUuidIsUnknown) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  PlugInRecord reregistered = r;
  reregistered.uuid = platform::Uuid::generate();
  reregistered.info.set("BXBundleName", "Again");
  registry_->put(reregistered);
  EXPECT_EQ(plugIn->localizedName(), "Again");
  EXPECT_TRUE(logged("Failed to find Plugin by " + r.uuid.toString() + " fallback to path " +
                         QVFileURLFromPath(r.path),
                     Level::Default, "hv"));
}

TEST_F(RegistryPlugInTest, RecordGoneGivesEmptyNamesAndNoInfo) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  r.info.set("BXBundleName", "Plain");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  ASSERT_TRUE(registry_->unregisterPlugIn(r.path).ok());
  // One stamp serves all caches: the info refresh below marks every cache
  // fresh, but caches still empty are fetched all the same.
  EXPECT_EQ(plugIn->bundleInfoDictionary(), nullptr);
  EXPECT_TRUE(plugIn->pluginKey("XOExtensionProtocol").isNone());
  EXPECT_EQ(plugIn->localizedName(), "");
  EXPECT_EQ(plugIn->localizedContainingName(), "");
  ASSERT_NE(plugIn->localizedStowageActionNames(), nullptr);
  EXPECT_TRUE(plugIn->localizedStowageActionNames()->empty());
  EXPECT_TRUE(logged("could not obtain fresh proxy for " + r.uuid.toString(), Level::Error, "ops"));
}

TEST_F(RegistryPlugInTest, StowageActionTitles) {
  Dictionary pd = validPlugInDictionary();
  pd.set("XOExtensionStowageActions",
         Array{Dictionary{{"XOExtensionStowageActionName", "Open"}},
               Dictionary{{"XOExtensionStowageActionName", "Share"}}, Dictionary{{"Other", 1}},
               "not a dictionary", Dictionary{{"XOExtensionStowageActionName", "Open"}}});
  PlugInRecord r = record("System/S.plugin", "com.example.s", pd);
  writeTable(r.path, "en", "Localizable", Dictionary{{"Open", "Open it"}});
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  ASSERT_NE(plugIn->localizedStowageActionNames(), nullptr);
  EXPECT_EQ(*plugIn->localizedStowageActionNames(),
            (Dictionary{{"Open", "Open it"}, {"Share", "Share"}}));
  EXPECT_EQ(countLogged("missing XOExtensionStowageActionName for plugin " + r.path), 2u);

  capture_->clear();
  const Dictionary none = plugIn->localizedStowageActionNamesForQVDict(r, validPlugInDictionary());
  EXPECT_TRUE(none.empty());
  EXPECT_TRUE(logged("no actions found in qvdict", Level::Default, "hv"));
}

TEST_F(RegistryPlugInTest, FormTokens) {
  const std::string kService = "fake;service;com.corvane.quorvex.plugin-service;";
  struct Case {
    const char* what;
    const char* relative;
    Dictionary plugIn;
    int serviceFailure;  // errno, 0: issuing works
    Value extensions;    // the keys of form["extensions"], none: absent
    Value serviceExtension;
  };
  Dictionary shared = validPlugInDictionary();
  shared.set("Shared", Array{"Resources", 7});
  const std::vector<Case> cases = {
      {"an application extension shares its bundle", "Applications/A.app/PlugIns/A.ovx",
       validPlugInDictionary(), 0, Array{"."}, Value(kService + "com.example.f")},
      {"listed resources", "System/S.plugin", shared, 0, Array{"Resources"},
       Value(kService + "com.example.f")},
      {"a data plug-in gets no service token", "System/D.plugin", validPlugInDictionary("#Data"), 0,
       Value(), Value()},
      {"a failed service token is left out", "System/F.plugin", validPlugInDictionary(), EPERM,
       Value(), Value()},
  };
  for (const Case& c : cases) {
    capture_->clear();
    extensions_->setFailure(platform::sandbox::ExtensionOperation::IssueService, c.serviceFailure);
    PlugInRecord r = record(c.relative, "com.example.f", c.plugIn);
    if (std::string_view(c.relative).starts_with("Applications/")) {
      r.containingApplicationPath = root_ + "/Applications/A.app";
    }
    std::shared_ptr<QVDPlugIn> plugIn = make(r);
    ASSERT_NE(plugIn, nullptr) << c.what;
    Dictionary form;
    plugIn->augmentForm(form);
    const Dictionary* tokens = form.get("extensions").dictionary();
    Value keys;
    if (tokens != nullptr) {
      Array names;
      for (const std::string& k : tokens->keys()) names.append(k);
      keys = names;
    }
    EXPECT_EQ(keys, c.extensions) << c.what;
    EXPECT_EQ(form.get("service-extension"), c.serviceExtension) << c.what;
    if (c.serviceFailure != 0) {
      EXPECT_TRUE(logged("failed to make mach extension for com.example.f in plug-in at " + r.path +
                             ": " + platform::Error::posix(EPERM).description(),
                         Level::Info, "ops"))
          << c.what;
    }
  }
}

}  // namespace
}  // namespace registry_plugin_test
