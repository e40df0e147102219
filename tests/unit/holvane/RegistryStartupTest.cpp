// What survives a restart: the start-up registration pass, records and
// generation kept in the database file, and recovery from a damaged file.
#include <gtest/gtest.h>

#include <algorithm>
#include <filesystem>

#include "platform/vmap/Writer.h"

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

bool anyLine(const std::vector<std::string>& lines, std::string_view needle) {
  return std::any_of(lines.begin(), lines.end(), [&](const std::string& line) {
    return line.find(needle) != std::string::npos;
  });
}

// The layout of a small installed system: one system plug-in, an
// application with two good plug-ins and a broken one, and a non-app folder
// in Applications that must be ignored.
class RegistryStartupTest : public ::testing::Test {
 protected:
  void SetUp() override {
    writeVmap(root_ / "System/Library/PlugIns/WorldClock.ovx/Info.vmap",
              plugInInfo("com.example.worldclock", "com.example.complication"));
    writeApplication(app_, "com.example.host");
    writeVmap(app_ + "/PlugIns/Share.ovx/Info.vmap", plugInInfo("com.example.share", "com.example.share-point"));
    writeVmap(app_ + "/PlugIns/Today.ovx/Info.vmap", plugInInfo("com.example.today", "com.example.widget"));
    writeText(app_ + "/PlugIns/Broken.ovx/Info.vmap", "not a document");
    writeVmap(root_ / "Applications/Docs/PlugIns/Stray.ovx/Info.vmap", plugInInfo("com.example.stray", "p"));
  }

  std::vector<std::string> storedPaths(LinuxRegistry& registry) {
    std::vector<std::string> paths;
    Result<std::vector<PlugInRecord>> all = registry.allPlugIns();
    EXPECT_TRUE(all.ok());
    if (!all.ok()) return paths;
    for (const PlugInRecord& record : *all) paths.push_back(record.path);
    return paths;
  }

  SystemRoot root_;
  std::string app_ = root_ / "Applications/Host.app";
};

TEST_F(RegistryStartupTest, ScanRegistersInstalledBundlesAndRestartKeepsThem) {
  Uuid generation;
  std::optional<PlugInRecord> share;
  {
    RegistryUnderTest first = openRegistry(root_);
    log::LogCaptureForTesting capture;
    Result<ScanSummary> summary = first.registry->scanInstalledBundles();
    ASSERT_TRUE(summary.ok());
    EXPECT_EQ(summary->registered, 3u);
    EXPECT_EQ(summary->refused, 1u);
    EXPECT_TRUE(anyLine(capture.messages(), "Broken.ovx"));
    EXPECT_EQ(storedPaths(*first.registry),
              (std::vector<std::string>{app_ + "/PlugIns/Share.ovx", app_ + "/PlugIns/Today.ovx",
                                        root_ / "System/Library/PlugIns/WorldClock.ovx"}));
    EXPECT_EQ((*first.registry->plugInByPath(root_ / "System/Library/PlugIns/WorldClock.ovx"))->volume,
              Volume::System);
    share = *first.registry->plugInByPath(app_ + "/PlugIns/Share.ovx");
    generation = first.registry->generation();
  }
  // A restart without a pass reads the same records and generation back.
  {
    RegistryUnderTest again = openRegistry(root_, StartupScan::Skip);
    EXPECT_EQ(again.registry->generation(), generation);
    EXPECT_EQ(*again.registry->plugInByUuid(share->uuid), share);
  }
  // A restart with a pass over the same bundles changes nothing.
  RegistryUnderTest third = openRegistry(root_, StartupScan::Run);
  EXPECT_EQ(third.registry->generation(), generation);
  EXPECT_EQ((*third.registry->plugInByPath(app_ + "/PlugIns/Share.ovx"))->uuid, share->uuid);
}

TEST_F(RegistryStartupTest, ScanDropsRecordsOfDeletedBundles) {
  Uuid generation;
  {
    RegistryUnderTest first = openRegistry(root_, StartupScan::Run);
    generation = first.registry->generation();
  }
  std::filesystem::remove_all(app_ + "/PlugIns/Today.ovx");
  RegistryUnderTest second = openRegistry(root_);
  std::vector<std::string> uninstalled;
  second.registry->addUninstallObserver(
      [&](const PlugInRecord& record) { uninstalled.push_back(record.path); });
  Result<ScanSummary> summary = second.registry->scanInstalledBundles();
  ASSERT_TRUE(summary.ok());
  EXPECT_EQ(summary->dropped, 1u);
  EXPECT_EQ(summary->unchanged, 2u);
  EXPECT_EQ(uninstalled, (std::vector<std::string>{app_ + "/PlugIns/Today.ovx"}));
  EXPECT_NE(second.registry->generation(), generation);
  EXPECT_FALSE(second.registry->plugInByPath(app_ + "/PlugIns/Today.ovx")->has_value());
}

TEST_F(RegistryStartupTest, DamagedDatabaseIsMovedAsideAndRebuilt) {
  writeText(root_ / "var/db/holvane/registry.sqlite", std::string(4096, '\x5a') + "garbage");
  log::LogCaptureForTesting capture;
  RegistryUnderTest opened = openRegistry(root_, StartupScan::Skip);
  ASSERT_NE(opened.registry, nullptr);
  EXPECT_TRUE(anyLine(capture.messages(), "rebuilding"));
  // Rebuilt by a pass even though none was asked for.
  EXPECT_EQ(opened.registry->allPlugIns()->size(), 3u);
  bool keptAside = false;
  for (const auto& entry : std::filesystem::directory_iterator(root_ / "var/db/holvane")) {
    keptAside |= entry.path().filename().string().starts_with("registry.sqlite.corrupt-");
  }
  EXPECT_TRUE(keptAside);
  // And it works as usual afterwards.
  ASSERT_TRUE(opened.registry->unregisterPlugIn(app_ + "/PlugIns/Share.ovx").ok());
  EXPECT_TRUE(opened.registry->registerPlugIn(app_ + "/PlugIns/Share.ovx").ok());
}

// A pass over more bundles than one transaction takes: every bundle is
// stored once, each install observer hears of each exactly once, and a
// restart finds them all.
TEST_F(RegistryStartupTest, LargePassIsStoredInBatches) {
  constexpr int kExtra = 40;
  ScanLimits limits;
  limits.changesPerTransaction = 7;
  for (int i = 0; i < kExtra; ++i) {
    Result<std::string> text = vmap::write(
        plugInInfo("com.example.extra" + std::to_string(i), "com.example.many"), vmap::Format::Xml);
    ASSERT_TRUE(text.ok());
    writeText(root_ / ("System/Library/PlugIns/Extra" + std::to_string(i) + ".ovx/Info.vmap"),
              *text);
  }
  Uuid generation;
  {
    RegistryUnderTest opened = openRegistry(root_, StartupScan::Skip, limits);
    std::vector<std::string> installed;
    opened.registry->addInstallObserver(
        [&](const PlugInRecord& record) { installed.push_back(record.identifier); });
    const Uuid before = opened.registry->generation();
    Result<ScanSummary> summary = opened.registry->scanInstalledBundles();
    ASSERT_TRUE(summary.ok());
    EXPECT_EQ(summary->registered, kExtra + 3u);
    EXPECT_EQ(installed.size(), kExtra + 3u);
    std::sort(installed.begin(), installed.end());
    EXPECT_EQ(std::adjacent_find(installed.begin(), installed.end()), installed.end());
    EXPECT_NE(opened.registry->generation(), before);
    generation = opened.registry->generation();
  }
  RegistryUnderTest again = openRegistry(root_, StartupScan::Skip);
  EXPECT_EQ(again.registry->allPlugIns()->size(), kExtra + 3u);
  EXPECT_EQ(again.registry->generation(), generation);
}

}  // namespace
}  // namespace platform::holvane
