#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <fstream>
#include <string>

#include "Quorvex/QVBundle.h"
#include "Quorvex/QVFileURL.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"

namespace {

class QVBundleTest : public ::testing::Test {
 protected:
  void SetUp() override {
    char tmpl[] = "/tmp/qvbundle-XXXXXX";
    ASSERT_NE(mkdtemp(tmpl), nullptr);
    char resolved[PATH_MAX];
    ASSERT_NE(realpath(tmpl, resolved), nullptr);
    root_ = resolved;
  }
  void TearDown() override { std::system(("rm -rf '" + root_ + "'").c_str()); }

  void write(const std::string& relative, const std::string& text, mode_t mode = 0644) {
    std::string path = root_ + "/" + relative;
    std::system(("mkdir -p '" + path.substr(0, path.rfind('/')) + "'").c_str());
    std::ofstream(path) << text;
    chmod(path.c_str(), mode);
  }
  static std::string manifest(const std::string& body) {
    return "<?xml version=\"1.0\"?>\n<vmap version=\"1.0\">\n<dict>\n" + body + "</dict>\n</vmap>\n";
  }

  std::string root_;
};

TEST_F(QVBundleTest, ApplicationFromItsExecutable) {
  write("Clock.app/Info.vmap",
        manifest("<key>BXBundleIdentifier</key><string>com.corvane.clock</string>"
                 "<key>BXExecutable</key><string>Clock</string>"));
  write("Clock.app/Clock", "#!/bin/sh\n", 0755);
  auto bundle = QVBundle::initWithExecutablePath(root_ + "/Clock.app/Clock");
  ASSERT_TRUE(bundle);
  EXPECT_EQ(bundle->path(), root_ + "/Clock.app");
  EXPECT_EQ(bundle->executablePath(), root_ + "/Clock.app/Clock");
  EXPECT_EQ(bundle->bundleIdentifier(), "com.corvane.clock");
  EXPECT_EQ(bundle->plugInsPath(), root_ + "/Clock.app/PlugIns");
  EXPECT_EQ(bundle->supportPath(), bundle->supportPath());  // cached, same answer
  ASSERT_TRUE(bundle->url());
  EXPECT_EQ(QVPathFromFileURL(*bundle->url()), bundle->path());
}

TEST_F(QVBundleTest, MissingManifestAnswersNoneAndLogs) {
  write("Empty.app/readme", "nothing here");
  platform::log::LoggerRegistry::shared().applyFilterForTesting("info");
  platform::log::LogCaptureForTesting capture;
  auto bundle = QVBundle::initWithPath(root_ + "/Empty.app");
  ASSERT_TRUE(bundle);
  EXPECT_FALSE(bundle->infoDictionary());
  EXPECT_FALSE(bundle->bundleIdentifier());
  platform::log::LoggerRegistry::shared().applyFilterForTesting("");
  auto messages = capture.messages();
  ASSERT_EQ(messages.size(), 1u);
  EXPECT_EQ(messages[0].rfind("failed to retrieve Info.vmap for ", 0), 0u) << messages[0];
}

TEST_F(QVBundleTest, RelativeOrNonFileLocationsGiveNone) {
  EXPECT_FALSE(QVBundle::initWithPath("relative/x.app"));
  EXPECT_FALSE(QVBundle::initWithURL("http://example/x.app"));
  EXPECT_FALSE(QVBundle::initWithExecutableURL("file:relative"));
}

TEST(QVFileURLTest, RoundTripsAwkwardPaths) {
  for (std::string path : {"/", "/a b/ü/%/#?"}) {
    std::string url = QVFileURLFromPath(path);
    EXPECT_EQ(url.rfind("file:///", 0), 0u) << url;
    EXPECT_EQ(url.find(' '), std::string::npos) << url;
    EXPECT_EQ(QVPathFromFileURL(url), path) << url;
  }
  EXPECT_EQ(QVPathFromFileURL("file://localhost/etc/x"), "/etc/x");
  EXPECT_EQ(QVPathFromFileURL("file:///a%2Fb"), "/a/b");
  for (const char* bad : {"file://host/x", "file:///x%2", "file:///x%00y", "/plain/path"}) {
    EXPECT_FALSE(QVPathFromFileURL(bad)) << bad;
  }
}

}  // namespace
