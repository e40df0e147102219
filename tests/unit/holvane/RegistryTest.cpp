// Registering, looking up and querying plug-in records, one registry per
// test over a fresh system root.
#include <gtest/gtest.h>
#include <sys/stat.h>

#include <algorithm>
#include <atomic>
#include <filesystem>
#include <set>
#include <thread>

#include "platform/holvane/RegistryError.h"
#include "platform/log/LogCaptureForTesting.h"
#include "tests/unit/holvane/HolvaneTestSupport.h"

namespace platform::holvane {
namespace {

using testing::AppExecutable;
using testing::openRegistry;
using testing::plugInInfo;
using testing::RegistryUnderTest;
using testing::SystemRoot;
using testing::writeApplication;
using testing::writeText;
using testing::writeVmap;

class RegistryTest : public ::testing::Test {
 protected:
  void SetUp() override { opened_ = openRegistry(root_); }
  LinuxRegistry& registry() { return *opened_.registry; }

  // A plug-in in Host.app; answers its bundle path.
  std::string writeAppPlugIn(const std::string& name, const Dictionary& info) {
    if (!std::filesystem::exists(app_)) writeApplication(app_, "com.example.host");
    const std::string path = app_ + "/PlugIns/" + name;
    writeVmap(path + "/Info.vmap", info);
    return path;
  }
  PlugInRecord mustRegister(const std::string& path) {
    Result<PlugInRecord> registered = registry().registerPlugIn(path);
    EXPECT_TRUE(registered.ok()) << registered.error().description();
    return registered.ok() ? *registered : PlugInRecord();
  }

  SystemRoot root_;
  RegistryUnderTest opened_;
  std::string app_ = root_ / "Applications/Host.app";
};

TEST_F(RegistryTest, RegisterLookUpUnregister) {
  const std::string path = writeAppPlugIn("Widget.ovx", plugInInfo("com.example.widget", "com.example.point"));
  const PlugInRecord record = mustRegister(path + "/");  // a trailing separator is not kept
  EXPECT_EQ(record.path, path);
  EXPECT_EQ(record.identifier, "com.example.widget");
  EXPECT_EQ(record.bundleIdentifier, "com.example.widget");
  EXPECT_EQ(record.version, "1.0");
  EXPECT_EQ(record.volume, Volume::Other);
  EXPECT_EQ(record.containingApplicationPath, app_);
  EXPECT_EQ(record.info.get("BXBundleInfoVmapURL"), Value("file://" + path + "/Info.vmap"));
  EXPECT_FALSE(record.uuid.isNull());

  Result<std::optional<PlugInRecord>> byUuid = registry().plugInByUuid(record.uuid);
  Result<std::optional<PlugInRecord>> byPath = registry().plugInByPath(path);
  ASSERT_TRUE(byUuid.ok() && byPath.ok());
  ASSERT_TRUE(byUuid->has_value() && byPath->has_value());
  EXPECT_EQ(**byUuid, record);  // what was stored reads back whole
  EXPECT_EQ(**byPath, record);

  ASSERT_TRUE(registry().unregisterPlugIn(path).ok());
  EXPECT_FALSE(registry().plugInByUuid(record.uuid)->has_value());
  EXPECT_FALSE(registry().plugInByPath(path)->has_value());
  Status again = registry().unregisterPlugIn(path);
  ASSERT_FALSE(again.ok());
  EXPECT_TRUE(isRegistryError(again.error(), RegistryErrorCode::NotFound));
}

TEST_F(RegistryTest, UuidKeptAndGenerationChangesOnlyWithContent) {
  const std::string path = writeAppPlugIn("Widget.ovx", plugInInfo("com.example.widget", "p"));
  const Uuid start = registry().generation();
  const PlugInRecord first = mustRegister(path);
  const Uuid afterFirst = registry().generation();
  EXPECT_NE(afterFirst, start);

  // Unchanged bundle: same record, nothing changed.
  EXPECT_EQ(mustRegister(path).uuid, first.uuid);
  EXPECT_EQ(registry().generation(), afterFirst);

  // Re-identified: the UUID and the original identifier stay.
  writeVmap(path + "/Info.vmap",
            plugInInfo("com.example.widget", "p", Dictionary{{"XOExtensionIdentifier", "renamed"}}));
  const PlugInRecord second = mustRegister(path);
  EXPECT_EQ(second.uuid, first.uuid);
  EXPECT_EQ(second.identifier, "renamed");
  EXPECT_EQ(second.originalIdentifier, "com.example.widget");
  const Uuid afterSecond = registry().generation();
  EXPECT_NE(afterSecond, afterFirst);

  ASSERT_TRUE(registry().unregisterPlugIn(path).ok());
  EXPECT_NE(registry().generation(), afterSecond);
  // Registered afresh after removal: a new plug-in as far as anyone knows.
  EXPECT_NE(mustRegister(path).uuid, first.uuid);
}

TEST_F(RegistryTest, IdentifierRule) {
  struct Case {
    const char* name;
    Dictionary extras;
    const char* expected;
  };
  const Case cases[] = {
      {"Explicit.ovx", Dictionary{{"XOExtensionIdentifier", "com.example.explicit"}},
       "com.example.explicit"},
      {"Fallback.ovx", Dictionary{}, "com.example.fallback"},
      {"Empty.ovx", Dictionary{{"XOExtensionIdentifier", ""}}, "com.example.empty"},
      {"NotText.ovx", Dictionary{{"XOExtensionIdentifier", 7}}, "com.example.nottext"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    std::string bundleId = std::string("com.example.") + c.name;
    bundleId = bundleId.substr(0, bundleId.size() - 4);
    std::transform(bundleId.begin(), bundleId.end(), bundleId.begin(), ::tolower);
    const std::string path = writeAppPlugIn(c.name, plugInInfo(bundleId, "p", c.extras));
    EXPECT_EQ(mustRegister(path).identifier, c.expected);
  }
}

TEST_F(RegistryTest, RefusedBundlesAreLoggedAndNotStored) {
  writeApplication(app_, "com.example.host");
  Dictionary noExtension = plugInInfo("com.example.a", "p");
  noExtension.remove("XOExtension");
  Dictionary extensionNotDictionary = plugInInfo("com.example.b", "p");
  extensionNotDictionary.set("XOExtension", "yes");
  Dictionary noIdentifier = plugInInfo("x", "p");
  noIdentifier.remove("BXBundleIdentifier");
  struct Case {
    const char* name;
    std::string path;
    std::function<void(const std::string&)> write;
    const char* reason;
  };
  auto info = [](Dictionary d) {
    return [d](const std::string& path) { writeVmap(path + "/Info.vmap", d); };
  };
  const Case cases[] = {
      {"missing Info.vmap", app_ + "/PlugIns/Missing.ovx",
       [](const std::string& path) { std::filesystem::create_directories(path); },
       "unreadable Info.vmap"},
      {"malformed Info.vmap", app_ + "/PlugIns/Garbage.ovx",
       [](const std::string& path) { writeText(path + "/Info.vmap", "<vmap><dict><key>"); },
       "unreadable Info.vmap"},
      {"no XOExtension", app_ + "/PlugIns/Plain.ovx", info(noExtension), "no XOExtension"},
      {"XOExtension not a dictionary", app_ + "/PlugIns/Odd.ovx", info(extensionNotDictionary),
       "no XOExtension"},
      {"no identifier", app_ + "/PlugIns/Anon.ovx", info(noIdentifier), "no identifier"},
      {"outside an application", root_ / "Library/PlugIns/Loose.ovx",
       info(plugInInfo("com.example.loose", "p")), "system volume"},
      {"only looks like the system volume", root_ / "SystemX/PlugIns/Fake.ovx",
       info(plugInInfo("com.example.fake", "p")), "system volume"},
      {"no such directory", app_ + "/PlugIns/Nowhere.ovx", [](const std::string&) {},
       "cannot register"},
  };
  const Uuid before = registry().generation();
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    c.write(c.path);
    log::LogCaptureForTesting capture;
    Result<PlugInRecord> registered = registry().registerPlugIn(c.path);
    ASSERT_FALSE(registered.ok());
    EXPECT_TRUE(isRegistryError(registered.error(), RegistryErrorCode::Refused));
    EXPECT_NE(registered.error().description().find(c.reason), std::string::npos)
        << registered.error().description();
    const std::vector<std::string> logged = capture.messages();
    EXPECT_TRUE(std::any_of(logged.begin(), logged.end(), [&](const std::string& line) {
      return line.find("cannot register") != std::string::npos;
    }));
    EXPECT_FALSE(registry().plugInByPath(c.path)->has_value());
  }
  EXPECT_TRUE(registry().allPlugIns()->empty());
  EXPECT_EQ(registry().generation(), before);
}

TEST_F(RegistryTest, SdkMergeAndExtensionPointName) {
  writeVmap(root_ / "System/Library/ExtensionPoints/com.example.sdk.vmap",
            Dictionary{{"SdkTop", "from sdk"},
                       {"XOExtension",
                        Dictionary{{"CleanTimeout", 5},
                                   {"XOExtensionAttributes",
                                    Dictionary{{"Kind", "sdk"}, {"SdkOnly", 1}}}}}});
  writeVmap(root_ / "System/Library/ExtensionPoints/com.example.named.vmap",
            Dictionary{{"XOExtension", Dictionary{{"XOExtensionAttributes",
                                                   Dictionary{{"XOExtensionPointName", "sdk-name"}}}}}});
  struct Case {
    const char* name;
    const char* point;
    Dictionary ownAttributes;
    const char* expectedName;
  };
  const Case cases[] = {
      {"Default.ovx", "com.example.sdk", Dictionary{{"Kind", "test"}}, "com.example.sdk"},
      {"NoSdk.ovx", "com.example.nosdk", Dictionary{}, "com.example.nosdk"},
      {"SdkNamed.ovx", "com.example.named", Dictionary{}, "sdk-name"},
      {"OwnName.ovx", "com.example.named", Dictionary{{"XOExtensionPointName", "own"}}, "own"},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const std::string path = writeAppPlugIn(
        c.name, plugInInfo(std::string("com.example.") + c.name, c.point,
                           Dictionary{{"XOExtensionAttributes", c.ownAttributes}}));
    const PlugInRecord record = mustRegister(path);
    EXPECT_EQ(record.extensionPointName, c.expectedName);
    const Dictionary* attributes = record.plugInDictionary()->get("XOExtensionAttributes").dictionary();
    ASSERT_NE(attributes, nullptr);
    EXPECT_EQ(attributes->get("XOExtensionPointName"), Value(c.expectedName));
  }
  const PlugInRecord merged = registry().plugInByPath(app_ + "/PlugIns/Default.ovx")->value();
  const Dictionary& plugIn = *merged.plugInDictionary();
  EXPECT_EQ(merged.info.get("SdkTop"), Value("from sdk"));
  EXPECT_EQ(plugIn.get("CleanTimeout"), Value(5));
  EXPECT_EQ(plugIn.get("XOExtensionAttributes").dictionary()->get("Kind"), Value("test"));
  EXPECT_EQ(plugIn.get("XOExtensionAttributes").dictionary()->get("SdkOnly"), Value(1));
}

TEST_F(RegistryTest, ContainingApplicationAndPlaceholder) {
  const std::string placeholderApp = root_ / "Applications/Pending.app";
  writeApplication(placeholderApp, "com.example.pending", AppExecutable::Missing);
  writeVmap(placeholderApp + "/PlugIns/P.ovx/Info.vmap", plugInInfo("com.example.p", "p"));
  const std::string a = writeAppPlugIn("A.ovx", plugInInfo("com.example.a", "p"));
  const std::string b = writeAppPlugIn("B.ovx", plugInInfo("com.example.b", "p"));
  for (const std::string& path : {a, b, placeholderApp + "/PlugIns/P.ovx"}) mustRegister(path);

  std::optional<ApplicationRecord> host = *registry().applicationByPath(app_);
  ASSERT_TRUE(host.has_value());
  EXPECT_EQ(host->bundleIdentifier, "com.example.host");
  EXPECT_EQ(host->executablePath, app_ + "/App");
  EXPECT_EQ(host->presence(), ExecutablePresence::Present);
  std::optional<ApplicationRecord> pending = *registry().applicationByPath(placeholderApp);
  ASSERT_TRUE(pending.has_value());
  EXPECT_EQ(pending->presence(), ExecutablePresence::Placeholder);

  std::vector<PlugInRecord> ofHost = *registry().plugInsOfApplication(app_);
  ASSERT_EQ(ofHost.size(), 2u);
  EXPECT_EQ(ofHost[0].path, a);
  EXPECT_EQ(ofHost[1].path, b);

  // The application is known through its plug-ins, and goes with the last.
  ASSERT_TRUE(registry().unregisterPlugIn(a).ok());
  EXPECT_TRUE(registry().applicationByPath(app_)->has_value());
  ASSERT_TRUE(registry().unregisterPlugIn(b).ok());
  EXPECT_FALSE(registry().applicationByPath(app_)->has_value());
}

TEST_F(RegistryTest, DataContainerForNonDataPlugInsOnly) {
  writeVmap(root_ / "System/Library/ExtensionPoints/com.example.datapoint.vmap",
            Dictionary{{"XOExtension", Dictionary{{"XOExtensionProtocol", "#Data"}}}});
  Dictionary ownData = plugInInfo("com.example.owndata", "p");
  ownData.set("XOExtension", Dictionary{{"XOExtensionPointIdentifier", "p"},
                                        {"XOExtensionProtocol", "#Data"}});
  Dictionary sdkData = plugInInfo("com.example.sdkdata", "com.example.datapoint");
  sdkData.set("XOExtension", Dictionary{{"XOExtensionPointIdentifier", "com.example.datapoint"}});
  struct Case {
    const char* name;
    Dictionary info;
    bool expectContainer;
  };
  const Case cases[] = {
      {"Regular.ovx", plugInInfo("com.example.regular", "p"), true},
      {"OwnData.ovx", ownData, false},
      {"SdkData.ovx", sdkData, false},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    const PlugInRecord record = mustRegister(writeAppPlugIn(c.name, c.info));
    const std::string expected =
        root_ / ("var/containers/Data/" + *c.info.get("BXBundleIdentifier").string());
    if (c.expectContainer) {
      EXPECT_EQ(record.dataContainer, expected);
      struct stat status {};
      ASSERT_EQ(::stat((expected + "/tmp").c_str(), &status), 0);
      EXPECT_EQ(status.st_mode & 07777, 0700u);
    } else {
      EXPECT_FALSE(record.dataContainer.has_value());
      EXPECT_FALSE(std::filesystem::exists(expected));
    }
  }
}

TEST_F(RegistryTest, FilteredQueryNarrowsByExtensionPointAndAsksTheFilterForEachRecord) {
  mustRegister(writeAppPlugIn("A1.ovx", plugInInfo("com.example.a1", "com.example.a")));
  mustRegister(writeAppPlugIn("A2.ovx", plugInInfo("com.example.a2", "com.example.a")));
  mustRegister(writeAppPlugIn("B1.ovx", plugInInfo("com.example.b1", "com.example.b")));

  std::vector<std::string> asked;
  RecordFilter skipA2 = [&](const PlugInRecord& record) {
    asked.push_back(record.identifier);
    return record.identifier == "com.example.a2" ? FilterVerdict::Skip : FilterVerdict::Keep;
  };
  Result<std::vector<PlugInRecord>> ofA = registry().queryPlugIns(std::string("com.example.a"), skipA2);
  ASSERT_TRUE(ofA.ok());
  EXPECT_EQ(asked, (std::vector<std::string>{"com.example.a1", "com.example.a2"}));
  ASSERT_EQ(ofA->size(), 1u);
  EXPECT_EQ((*ofA)[0].identifier, "com.example.a1");

  asked.clear();
  EXPECT_EQ(registry().queryPlugIns(std::nullopt, skipA2)->size(), 2u);
  EXPECT_EQ(asked.size(), 3u);
  EXPECT_TRUE(registry().queryPlugIns(std::string("com.example.none"), skipA2)->empty());
}

TEST_F(RegistryTest, ObserversSeeInstallAfterStoreAndUninstallBeforeRemoval) {
  const std::string path = writeAppPlugIn("Seen.ovx", plugInInfo("com.example.seen", "p"));
  std::vector<std::string> events;
  registry().addInstallObserver([&](const PlugInRecord& record) {
    // Observers run on the registry's queue and may ask it questions.
    const bool stored = registry().plugInByPath(record.path)->has_value();
    events.push_back(std::string("install ") + (stored ? "stored" : "missing"));
  });
  registry().addUninstallObserver([&](const PlugInRecord& record) {
    const bool stored = registry().plugInByPath(record.path)->has_value();
    events.push_back(std::string("uninstall ") + (stored ? "stored" : "missing"));
  });
  mustRegister(path);
  mustRegister(path);  // unchanged: no news
  ASSERT_TRUE(registry().unregisterPlugIn(path).ok());
  EXPECT_EQ(events, (std::vector<std::string>{"install stored", "uninstall stored"}));
}

TEST_F(RegistryTest, EntitlementsOfTheBundleAreRecorded) {
  const std::string path = writeAppPlugIn("Entitled.ovx", plugInInfo("com.example.entitled", "p"));
  writeVmap(path + "/Entitlements.vmap", Dictionary{{"com.example.right", true}});
  const PlugInRecord record = mustRegister(path);
  ASSERT_TRUE(record.entitlements.has_value());
  EXPECT_EQ(record.entitlements->get("com.example.right"), Value(true));
}

TEST_F(RegistryTest, CallersOnManyThreadsAreSerialised) {
  constexpr int kThreads = 4;
  constexpr int kEach = 3;
  std::vector<std::string> paths;
  for (int i = 0; i < kThreads * kEach; ++i) {
    const std::string name = "P" + std::to_string(i);
    paths.push_back(writeAppPlugIn(name + ".ovx", plugInInfo("com.example." + name, "p")));
  }
  std::atomic<int> failures{0};
  std::vector<std::thread> threads;
  for (int t = 0; t < kThreads; ++t) {
    threads.emplace_back([&, t] {
      for (int i = 0; i < kEach; ++i) {
        if (!registry().registerPlugIn(paths[t * kEach + i]).ok()) ++failures;
        if (!registry().queryPlugIns(std::string("p"), nullptr).ok()) ++failures;
      }
    });
  }
  for (std::thread& thread : threads) thread.join();
  EXPECT_EQ(failures.load(), 0);
  Result<std::vector<PlugInRecord>> all = registry().allPlugIns();
  ASSERT_TRUE(all.ok());
  ASSERT_EQ(all->size(), paths.size());
  std::set<Uuid> uuids;
  for (const PlugInRecord& record : *all) uuids.insert(record.uuid);
  EXPECT_EQ(uuids.size(), paths.size());
}

}  // namespace
}  // namespace platform::holvane
