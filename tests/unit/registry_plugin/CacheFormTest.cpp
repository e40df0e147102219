// Caches following the registration generation, names, and form tokens.
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
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(plugIn->localizedName(), "Shown");
  EXPECT_EQ(plugIn->localizedShortName(), "Plain");
  const std::size_t lookups = registry_->lookupCount();
  EXPECT_EQ(plugIn->localizedName(), "Shown");
  EXPECT_EQ(registry_->lookupCount(), lookups) << "unchanged generation, no lookup";
  // Any new record changes the generation; the next read asks again.
  locale_->setLocale("de_DE");
  registry_->put(record("System/Other.plugin", "com.example.other"));
  EXPECT_EQ(plugIn->localizedName(), "Gezeigt");
}

// A lent record stands in for the registry only while the registry is still
// at the generation it was lent at, and only while its lender keeps it.
TEST_F(RegistryPlugInTest, LentRecordsServeOnlyTheirGenerationAndTheirLender) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  PlugInRecord lentCopy = r;
  lentCopy.info.set("BXBundleName", "Lent");
  auto lent = std::make_shared<const PlugInRecord>(lentCopy);
  plugIn->lendRecord(registry_->generation(), lent);
  std::size_t lookups = registry_->lookupCount();
  ASSERT_TRUE(plugIn->getProxy().has_value());
  EXPECT_EQ(*plugIn->getProxy()->info.get("BXBundleName").string(), "Lent");
  EXPECT_EQ(registry_->lookupCount(), lookups) << "a lent record needs no lookup";

  // Dropped by its lender: the registry answers again.
  lent.reset();
  EXPECT_FALSE(plugIn->getProxy()->info.get("BXBundleName") == platform::Value("Lent"));
  EXPECT_GT(registry_->lookupCount(), lookups);

  // Lent at a generation that has passed: the registry answers.
  lent = std::make_shared<const PlugInRecord>(lentCopy);
  plugIn->lendRecord(registry_->generation(), lent);
  registry_->put(record("System/Other.plugin", "com.example.other"));
  lookups = registry_->lookupCount();
  EXPECT_FALSE(plugIn->getProxy()->info.get("BXBundleName") == platform::Value("Lent"));
  EXPECT_GT(registry_->lookupCount(), lookups);
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
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  ASSERT_TRUE(registry_->unregisterPlugIn(r.path).ok());
  EXPECT_EQ(plugIn->bundleInfoDictionary(), nullptr);
  EXPECT_EQ(plugIn->localizedName(), "");
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
  EXPECT_EQ(*plugIn->localizedStowageActionNames(),
            (Dictionary{{"Open", "Open it"}, {"Share", "Share"}}));
  EXPECT_EQ(countLogged("missing XOExtensionStowageActionName for plugin " + r.path), 2u);
}

TEST_F(RegistryPlugInTest, FormTokens) {
  PlugInRecord app = record("Applications/A.app/PlugIns/A.ovx", "com.example.f");
  app.containingApplicationPath = root_ + "/Applications/A.app";
  Dictionary form;
  make(app)->augmentForm(form);
  EXPECT_EQ(form.get("extensions").dictionary()->keys(), std::vector<std::string>{"."});
  EXPECT_EQ(form.get("service-extension"),
            Value("fake;service;com.corvane.quorvex.plugin-service;com.example.f"));

  extensions_->setFailure(platform::sandbox::ExtensionOperation::IssueService, EPERM);
  PlugInRecord r = record("System/F.plugin", "com.example.f");
  Dictionary failed;
  make(r)->augmentForm(failed);
  EXPECT_TRUE(failed.get("service-extension").isNone());
  EXPECT_TRUE(logged("failed to make mach extension for com.example.f in plug-in at " + r.path +
                         ": " + platform::Error::posix(EPERM).description(),
                     Level::Info, "ops"));
}

}  // namespace
}  // namespace registry_plugin_test
