// Registering, looking up and querying plug-in records, one registry per
// test over a fresh system root.
#include <gtest/gtest.h>

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

TEST_F(RegistryTest, RefusedBundlesAreLoggedAndNotStored) {
  writeApplication(app_, "com.example.host");
  Dictionary noExtension = plugInInfo("com.example.a", "p");
  noExtension.remove("XOExtension");
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
      {"no XOExtension", app_ + "/PlugIns/Plain.ovx", info(noExtension), "no XOExtension"},
      {"no identifier", app_ + "/PlugIns/Anon.ovx", info(noIdentifier), "no identifier"},
      {"outside an application", root_ / "Library/PlugIns/Loose.ovx",
       info(plugInInfo("com.example.loose", "p")), "system volume"},
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
