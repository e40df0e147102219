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

TEST_F(FormTest, DefaultsAndRecoveries) {
  auto bare =
      QVPlugInCore::initWithName("b", url("/S/b"), Value(infoWith({})), std::nullopt, std::nullopt);
  bare->setOriginalIdentifier("b");
  Dictionary form = *bare->exportForm(nullptr);
  EXPECT_EQ(form.get("annotations"), Value(Dictionary{}));
  EXPECT_FALSE(form.contains("entitlements"));
  EXPECT_FALSE(form.contains("containingPath"));
  EXPECT_FALSE(form.contains("localizedDisplayName"));

  // "<none>" is not read back: the version comes from the manifest again.
  auto versioned = recordAt(
      "/S/v", infoWith({{"XOExtensionAttributes", Dictionary{{"XOExtensionVersion", "3"}}}}));
  versioned->setOriginalIdentifier("v");
  versioned->setPlugInDictionary(Dictionary{});
  const Dictionary versionForm = *versioned->exportForm(nullptr);
  EXPECT_EQ(versionForm.get("version"), Value("<none>"));
  EXPECT_EQ(QVPlugInCore::initWithForm(versionForm)->version(), Value("3"));

  struct Case {
    const char* what;
    Value hub;
    std::uint32_t wantHub;
    Value uuid;
    bool sameIdentity;
  } cases[] = {
      {"no hub version", Value(), 1, form.get("uuid"), true},
      {"hub version 2", Value(2), 2, form.get("uuid"), true},
      {"unparsable uuid", Value(2), 2, Value("not-a-uuid"), false},
      {"no uuid", Value(), 1, Value(), false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.what);
    Dictionary changed = form;
    changed.set("hubProtocolVersion", c.hub);
    changed.set("uuid", c.uuid);
    auto back = QVPlugInCore::initWithForm(changed);
    ASSERT_TRUE(back);
    ASSERT_TRUE(back->uuid());
    EXPECT_EQ(back->hubProtocolVersion(), c.wantHub);
    EXPECT_EQ(back->isEqual(bare.get()), c.sameIdentity);
    ASSERT_TRUE(back->annotations());  // an empty dictionary, not none
    EXPECT_TRUE(back->annotations()->empty());
  }
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
      {"no identifier", "identifier", Value()},
      {"bundleInfo not a dictionary", "bundleInfo", Value(3)},
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

TEST_F(FormTest, UpdateTakesOnlyAnnotations) {
  auto record = fullRecord();
  record->updateFromForm(
      Dictionary{{"annotations", Dictionary{{"election", 0}}}, {"identifier", "other"}});
  EXPECT_EQ(*record->annotations(), (Dictionary{{"election", 0}}));
  EXPECT_EQ(record->identifier(), "com.example.e");
  record->updateFromForm(Dictionary{});
  EXPECT_FALSE(record->annotations());
}

}  // namespace
}  // namespace plugin_record_test
