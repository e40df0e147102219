// A dedicated plug-in serves the one application it ships in: a host that
// runs from that application's bundle finds it, while a host in another
// application, or outside any bundle, never sees it. The hosts are copies
// of qvctl installed as the applications' executables, so the daemon tells
// them apart exactly as it tells real hosts apart: by the executable behind
// the connection.
#include <gtest/gtest.h>

#include <cctype>
#include <filesystem>
#include <optional>
#include <string>
#include <vector>

#include "platform/values/Array.h"
#include "tests/integration/RootContents.h"

namespace qvd::integration {
namespace {

using platform::Array;
using platform::Dictionary;

constexpr const char* kPoint = "com.example.widgets";

class DedicatedPlugInTest : public ::testing::Test {
 protected:
  void SetUp() override {
    writeSystemPlugIn(root_, "everyone", kPoint);
    host_ = installApplication("Host", Dictionary{{"Dedicated", true}});
    other_ = installApplication("Other", Dictionary{});
    daemon_.emplace(root_, std::vector<std::string>{});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
  }
  void TearDown() override {
    if (daemon_) {
      EXPECT_EQ(daemon_->terminate(), 0) << daemon_->log();
    }
  }

  // Applications/<name>.app, whose executable is a copy of qvctl, with one
  // plug-in com.example.<lowercase name>-widget whose extension dictionary
  // also holds `extra`. Returns the path of the executable.
  std::string installApplication(const std::string& name, const Dictionary& extra) {
    const std::string app = root_ / ("Applications/" + name + ".app");
    std::string id = name;
    for (char& c : id) c = static_cast<char>(std::tolower(static_cast<unsigned char>(c)));
    writeVmapFile(app + "/Info.vmap",
                  Dictionary{{"BXBundleIdentifier", "com.example." + id}, {"BXExecutable", "App"}});
    std::filesystem::copy_file(QVCTL_PATH, app + "/App");
    Dictionary extension{{"XOExtensionPointIdentifier", kPoint},
                         {"XOExtensionProtocol", Array{"QVWidget"}}};
    for (const auto& [key, value] : extra) extension.set(key, value);
    writeVmapFile(app + "/PlugIns/Widget.ovx/Info.vmap",
                  Dictionary{{"BXBundleIdentifier", "com.example." + id + "-widget"},
                             {"BXBundleShortVersionString", "1.0"},
                             {"BXExecutable", "Widget"},
                             {"XOExtension", extension}});
    return app + "/App";
  }

  // The identifiers a match for the extension point shows to `host`.
  std::vector<std::string> seenBy(const std::string& host) {
    Finished run = runProcess({host, "match", std::string("XOExtensionPointName=") + kPoint},
                              root_.path());
    EXPECT_EQ(run.status, 0) << run.err << daemon_->log();
    std::vector<std::string> seen;
    for (const char* id : {"com.example.everyone", "com.example.host-widget",
                           "com.example.other-widget"}) {
      if (run.out.find(id) != std::string::npos) seen.push_back(id);
    }
    return seen;
  }

  TemporaryRoot root_;
  std::string host_;
  std::string other_;
  std::optional<Daemon> daemon_;
};

TEST_F(DedicatedPlugInTest, OnlyTheApplicationThatShipsItSeesIt) {
  EXPECT_EQ(seenBy(host_), (std::vector<std::string>{"com.example.everyone",
                                                     "com.example.host-widget",
                                                     "com.example.other-widget"}));
  EXPECT_EQ(seenBy(other_),
            (std::vector<std::string>{"com.example.everyone", "com.example.other-widget"}));
  EXPECT_EQ(seenBy(QVCTL_PATH),
            (std::vector<std::string>{"com.example.everyone", "com.example.other-widget"}));
}

}  // namespace
}  // namespace qvd::integration
