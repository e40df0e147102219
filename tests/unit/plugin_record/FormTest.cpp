#include "Quorvex/QVErrors.h"
#include "RecordTestSupport.h"

namespace plugin_record_test {
namespace {

const platform::Uuid kId = *platform::Uuid::parse("e621e1f8-c36c-495a-93fc-0c247a3e6e5f");

// A record as the daemon would hold one, with every field the form carries.
std::shared_ptr<QVPlugInCore> fullRecord() {
  const Dictionary info =
      infoWith({{"XOExtensionProtocol", "P"}},
               {{"BXBundleDisplayName", "Plain"},
                {"BXBundleInfoVmapURL", "file:///A.app/PlugIns/e.ovx/Info.vmap"},
                {"DTCompiler", "cc"}});
  auto record = QVPlugInCore::initWithName("com.example.e", url("/A.app/PlugIns/e.ovx"),
                                           Value(info), std::nullopt, kId);
  record->setOriginalIdentifier("com.example.original");
  record->setHubProtocolVersion(2);
  record->setOnSystemVolume(true);
  record->setLastModified(1700000123);
  record->setEntitlements(Dictionary{{"com.example.ent", true}});
  record->setContainingUrl(url("/A.app"));
  record->setAnnotations(Dictionary{{"election", 1}});
  record->setLocalizedName("Lokal");
  record->setLocalizedShortName("L");
  record->setLocalizedContainingName("App");
  record->setLocalizedStowageActionNames(Dictionary{{"Open", "Öffnen"}});
  return record;
}

using FormTest = RecordTest;

TEST_F(FormTest, ExportWritesTheTableInOrder) {
  auto record = fullRecord();
  std::optional<platform::Error> error;
  std::optional<Dictionary> form = record->exportForm(&error);
  ASSERT_TRUE(form);
  EXPECT_FALSE(error);
  EXPECT_EQ(form->keys(),
            (std::vector<std::string>{
                "hubProtocolVersion", "path", "systemResident", "identifier", "original-identifier",
                "version", "bundleInfo", "info", "uuid", "lastmodified", "annotations",
                "entitlements", "containingPath", "localizedContainingDisplayName",
                "localizedDisplayName", "localizedShortName", "localizedStowageActionNames"}));
  EXPECT_EQ(form->get("uuid"), Value("E621E1F8-C36C-495A-93FC-0C247A3E6E5F"));
  EXPECT_EQ(form->get("version"), Value("<none>"));  // never canonicalised
  EXPECT_EQ(form->get("path"), Value("/A.app/PlugIns/e.ovx"));

  const Dictionary* bundleInfo = form->get("bundleInfo").dictionary();
  ASSERT_TRUE(bundleInfo);
  EXPECT_FALSE(bundleInfo->contains("BXBundleInfoVmapURL"));
  EXPECT_EQ(bundleInfo->get("BXBundleDisplayName"), Value("Lokal"));
  EXPECT_EQ(bundleInfo->get("DTCompiler"), Value("cc"));  // build keys travel
  // The record itself still has the manifest as read.
  EXPECT_EQ(record->bundleInfoDictionary()->get("BXBundleDisplayName"), Value("Plain"));
  EXPECT_TRUE(record->bundleInfoDictionary()->contains("BXBundleInfoVmapURL"));
  EXPECT_TRUE(logged("-[QVPlugInCore export:] BundleInfo[BundleDisplayName] was Plain",
                     Level::Debug, "hv"));
  EXPECT_TRUE(
      logged("-[QVPlugInCore export:] BundleInfo[BundleDisplayName] is Lokal", Level::Debug, "hv"));
}

TEST_F(FormTest, ReadBackKeepsWhatTheFormCarries) {
  auto record = fullRecord();
  Dictionary form = *record->exportForm(nullptr);
  form.set("hash", platform::Data{1, 2, 3});
  form.set("requirement", "anchor trusted");
  form.set("service-extension", "token");  // not read back, must not disturb

  auto back = QVPlugInCore::initWithForm(form);
  ASSERT_TRUE(back);
  EXPECT_TRUE(back->isEqual(record.get()));
  EXPECT_EQ(back->identifier(), record->identifier());
  EXPECT_EQ(back->path(), record->path());
  EXPECT_EQ(back->originalIdentifier(), "com.example.original");
  EXPECT_EQ(back->hubProtocolVersion(), 2u);
  EXPECT_TRUE(back->onSystemVolume());
  EXPECT_EQ(back->lastModified(), 1700000123);
  EXPECT_EQ(*back->entitlements(), *record->entitlements());
  EXPECT_EQ(back->containingPath(), "/A.app");
  EXPECT_EQ(*back->annotations(), (Dictionary{{"election", 1}}));
  EXPECT_EQ(back->localizedName(), "Lokal");
  EXPECT_EQ(back->localizedShortName(), "L");
  EXPECT_EQ(back->localizedContainingName(), "App");
  EXPECT_EQ(*back->localizedStowageActionNames(), *record->localizedStowageActionNames());
  EXPECT_EQ(back->cdhash(), (platform::Data{1, 2, 3}));
  EXPECT_EQ(back->requirement(), "anchor trusted");
  // The plug-in dictionary comes from the info dictionary, so the version is
  // recomputed from it rather than read as "<none>".
  EXPECT_TRUE(back->version().isNone());
  back->canonicalize();
  EXPECT_EQ(back->version(), Value("1"));
}

TEST_F(FormTest, FormsThatMakeNoRecord) {
  Dictionary good{{"path", "/S/p"}, {"identifier", "p"}, {"bundleInfo", infoWith({})}};
  ASSERT_TRUE(QVPlugInCore::initWithForm(good));

  struct Case {
    const char* what;
    const char* key;
    Value value;
  } cases[] = {
      {"no path", "path", Value()},
      {"relative path", "path", Value("S/p")},
      {"bundleInfo without XOExtension", "bundleInfo", Value(Dictionary{{"BXBundleName", "n"}})},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Dictionary form = good;
    form.set(c.key, c.value);
    EXPECT_FALSE(QVPlugInCore::initWithForm(form));
  }

  // Without bundleInfo the record has no manifest at all; "info" is not used.
  Dictionary noManifest{{"path", "/S/p"}, {"identifier", "p"}, {"info", infoWith({})}};
  auto record = QVPlugInCore::initWithForm(noManifest);
  ASSERT_TRUE(record);
  EXPECT_FALSE(record->plugInDictionary());
  EXPECT_FALSE(record->bundleInfoDictionary());
}

TEST_F(FormTest, ExportRefusesARecordMissingABaseKey) {
  struct Case {
    const char* what;
    void (*damage)(QVPlugInCore&);
    const char* missing;
  } cases[] = {
      {"original identifier", [](QVPlugInCore& r) { r.setOriginalIdentifier(std::nullopt); },
       "original identifier"},
      {"info dictionary", [](QVPlugInCore& r) { r.setBundleInfoDictionary(std::nullopt); },
       "info dictionary"},
      {"plug-in dictionary", [](QVPlugInCore& r) { r.setPlugInDictionary(std::nullopt); },
       "plug-in dictionary"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    auto record = fullRecord();
    c.damage(*record);
    std::optional<platform::Error> error;
    EXPECT_FALSE(record->exportForm(&error));
    ASSERT_TRUE(error);
    EXPECT_TRUE(QVErrorIs(*error, QVErrorInvalidPlugIn));
    EXPECT_EQ(error->description(), std::string("cannot export plug-in com.example.e at "
                                                "/A.app/PlugIns/e.ovx: no ") +
                                        c.missing);
    EXPECT_FALSE(record->exportForm(nullptr));  // no error slot: still no crash
  }
}

}  // namespace
}  // namespace plugin_record_test
