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

// Without a containing application the name stays empty; asking again in
// the same generation must not query the registry (every form asks), but a
// new generation may bring an application along.
TEST_F(RegistryPlugInTest, AnAbsentContainingNameIsAskedForOncePerGeneration) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  EXPECT_EQ(plugIn->localizedContainingName(), "");
  const std::size_t lookups = registry_->lookupCount();
  EXPECT_EQ(plugIn->localizedContainingName(), "");
  EXPECT_EQ(registry_->lookupCount(), lookups);

  platform::holvane::ApplicationRecord app;
  app.path = root_ + "/Applications/A.app";
  app.info.set("BXBundleName", "Host");
  registry_->putApplication(app);
  PlugInRecord moved = r;
  moved.containingApplicationPath = app.path;
  registry_->put(moved);
  EXPECT_EQ(plugIn->localizedContainingName(), "Host");
}

// A record that cannot be found is asked for again each time: the registry
// may answer once it has caught up.
TEST_F(RegistryPlugInTest, AContainingNameWithoutARecordIsAskedForEachTime) {
  PlugInRecord r = record("System/P.plugin", "com.example.p");
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  registry_->failQueries(platform::Error::posix(EIO, "registry down"));
  EXPECT_EQ(plugIn->localizedContainingName(), "");
  const std::size_t lookups = registry_->lookupCount();
  EXPECT_EQ(plugIn->localizedContainingName(), "");
  EXPECT_GT(registry_->lookupCount(), lookups);
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

// Tokens that depend on the registration alone (the whole bundle, the
// service) are issued once per generation; entries inside the bundle are
// issued every time, and a failed issue is tried again.
TEST_F(RegistryPlugInTest, RegistrationTokensAreIssuedOncePerGeneration) {
  Dictionary pd = validPlugInDictionary();
  pd.set("Shared", Array{".", "Resources/data"});
  PlugInRecord r = record("System/T.plugin", "com.example.t", pd);
  std::shared_ptr<QVDPlugIn> plugIn = make(r);
  ASSERT_NE(plugIn, nullptr);
  using Op = platform::sandbox::ExtensionOperation;
  auto issuedOf = [&](std::size_t from) {
    std::vector<std::string> subjects;
    const auto all = extensions_->issued();
    for (std::size_t i = from; i < all.size(); ++i) {
      subjects.push_back((all[i].operation == Op::IssueService ? "service " : "file ") +
                         all[i].subject);
    }
    return subjects;
  };
  Dictionary first;
  plugIn->augmentForm(first);
  EXPECT_EQ(issuedOf(0),
            (std::vector<std::string>{"file " + r.path, "file " + r.path + "/Resources/data",
                                      "service com.example.t"}));
  std::size_t before = extensions_->issued().size();
  Dictionary second;
  plugIn->augmentForm(second);
  EXPECT_EQ(second, first) << "the same tokens";
  EXPECT_EQ(issuedOf(before), std::vector<std::string>{"file " + r.path + "/Resources/data"});

  registry_->put(record("System/Other.plugin", "com.example.other"));
  before = extensions_->issued().size();
  extensions_->setFailure(Op::IssueService, EPERM);
  Dictionary third;
  plugIn->augmentForm(third);
  EXPECT_EQ(issuedOf(before),
            (std::vector<std::string>{"file " + r.path, "file " + r.path + "/Resources/data"}));
  EXPECT_TRUE(third.get("service-extension").isNone());
  extensions_->setFailure(Op::IssueService, 0);
  before = extensions_->issued().size();
  Dictionary fourth;
  plugIn->augmentForm(fourth);
  EXPECT_EQ(issuedOf(before), (std::vector<std::string>{"file " + r.path + "/Resources/data",
                                                        "service com.example.t"}));
  EXPECT_EQ(fourth, first);
}

}  // namespace
}  // namespace registry_plugin_test
