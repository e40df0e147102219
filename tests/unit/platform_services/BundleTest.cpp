// Bundles built in a scratch directory: the two path kinds, the numbered
// properties, manifests missing or malformed, plug-ins and the application
// that contains them, canonical paths.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include "platform/bundle/Bundle.h"
#include "platform/bundle/BundleError.h"
#include "platform/vmap/VmapError.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::bundle {
namespace {

using services_testing::ScratchDirectory;
using services_testing::writeText;
using services_testing::writeVmap;

constexpr int kBundlePath = 2;
constexpr int kExecutablePath = 3;
constexpr int kSupportFilesPath = 9;

Bundle make(const std::string& path, BundlePathKind kind) {
  Result<Bundle> made = Bundle::create(path, kind);
  EXPECT_TRUE(made.ok()) << path;
  return made.ok() ? std::move(made).value() : Bundle::create("/", kind).value();
}

class PlatformBundleTest : public ::testing::Test {
 protected:
  // An application X.app with executable X and a tool in a subdirectory.
  void SetUp() override {
    app_ = scratch_ / "Applications/X.app";
    writeVmap(app_ + "/Info.vmap", Dictionary{{"BXExecutable", "X"}});
    writeText(app_ + "/X", "binary");
    writeText(app_ + "/bin/tool", "binary");
  }
  ScratchDirectory scratch_;
  std::string app_;
};

TEST_F(PlatformBundleTest, ExecutableInsideAnApplication) {
  for (const std::string& executable : {app_ + "/X", app_ + "/bin/tool"}) {
    Bundle bundle = make(executable, BundlePathKind::Executable);
    EXPECT_EQ(bundle.property(kBundlePath), Value(app_)) << executable;
    EXPECT_EQ(bundle.property(kExecutablePath), Value(app_ + "/X")) << executable;
    EXPECT_EQ(bundle.property(kSupportFilesPath), Value(app_)) << executable;
    EXPECT_TRUE(bundle.isApplication());
    EXPECT_FALSE(bundle.isPlugIn());
    ASSERT_NE(bundle.infoDictionary(), nullptr);
    EXPECT_FALSE(bundle.containingApplication().has_value());
  }
  EXPECT_TRUE(make(app_, BundlePathKind::Directory).property(7).isNone());
}

TEST_F(PlatformBundleTest, DirectoryGivenAsExecutablePathWalksUpFromItsParent) {
  // The bundle directory itself, given as an executable, is a file in
  // Applications/, which no bundle holds.
  Bundle outside = make(app_, BundlePathKind::Executable);
  EXPECT_FALSE(outside.bundleDirectory().has_value());
  for (int number : {kBundlePath, kExecutablePath, kSupportFilesPath}) {
    EXPECT_TRUE(outside.property(number).isNone()) << number;
  }
  ASSERT_TRUE(outside.infoError().has_value());
  EXPECT_TRUE(isBundleError(*outside.infoError(), BundleErrorCode::NoBundleDirectory));

  // A directory inside the bundle, given as an executable, finds it.
  EXPECT_EQ(make(app_ + "/bin", BundlePathKind::Executable).property(kBundlePath), Value(app_));
  // So does a missing executable whose directory exists.
  EXPECT_EQ(make(app_ + "/bin/gone", BundlePathKind::Executable).property(kBundlePath),
            Value(app_));
}

TEST_F(PlatformBundleTest, ExecutableAbsentOrOutsideHasNoProperty3) {
  const std::string bundle = scratch_ / "B.app";
  writeText(scratch_ / "outside", "binary");
  services_testing::makeDirectories(bundle + "/Dir");
  writeText(bundle + "/sub/real", "binary");
  ASSERT_EQ(::symlink((scratch_ / "outside").c_str(), (bundle + "/escape").c_str()), 0);
  for (const char* name : {"Missing", "../outside", "escape", "Dir", "/bin/sh"}) {
    writeVmap(bundle + "/Info.vmap", Dictionary{{"BXExecutable", name}});
    Bundle made = make(bundle, BundlePathKind::Directory);
    EXPECT_EQ(made.property(kBundlePath), Value(bundle)) << name;
    EXPECT_TRUE(made.property(kExecutablePath).isNone()) << name;
  }
  writeVmap(bundle + "/Info.vmap", Dictionary{{"BXExecutable", "sub/real"}});
  EXPECT_EQ(make(bundle, BundlePathKind::Directory).property(kExecutablePath),
            Value(bundle + "/sub/real"));
  writeVmap(bundle + "/Info.vmap", Dictionary{{"BXBundleName", "B"}});
  EXPECT_TRUE(make(bundle, BundlePathKind::Directory).property(kExecutablePath).isNone());
}

TEST_F(PlatformBundleTest, PlugInInsideAnApplicationKnowsItsApplication) {
  const std::string plugIn = app_ + "/PlugIns/p.ovx";
  writeVmap(plugIn + "/Info.vmap",
            Dictionary{{"BXExecutable", "p"},
                       {"XOExtension", Dictionary{{"XOExtensionPointIdentifier", "x"}}}});
  writeText(plugIn + "/p", "binary");
  Bundle bundle = make(plugIn + "/p", BundlePathKind::Executable);
  EXPECT_EQ(bundle.property(kBundlePath), Value(plugIn));
  EXPECT_EQ(bundle.property(kSupportFilesPath), Value(plugIn));
  EXPECT_TRUE(bundle.isPlugIn());
  EXPECT_TRUE(bundle.isApplicationExtension());
  EXPECT_FALSE(bundle.isApplication());
  std::optional<Bundle> application = bundle.containingApplication();
  ASSERT_TRUE(application.has_value());
  EXPECT_EQ(application->property(kBundlePath), Value(app_));
  EXPECT_EQ(application->property(kExecutablePath), Value(app_ + "/X"));
  EXPECT_TRUE(application->isApplication());

  // Deeper inside PlugIns/ still counts; beside it does not.
  const std::string nested = app_ + "/PlugIns/Group/q.bundle";
  writeVmap(nested + "/Info.vmap", Dictionary{{"Quorvex", Dictionary{}}});
  Bundle deep = make(nested, BundlePathKind::Directory);
  EXPECT_TRUE(deep.isPlugIn());
  EXPECT_FALSE(deep.isApplicationExtension());
  ASSERT_TRUE(deep.containingApplication().has_value());
  EXPECT_EQ(deep.containingApplication()->property(kBundlePath), Value(app_));
  const std::string beside = app_ + "/Resources/r.ovx";
  writeVmap(beside + "/Info.vmap", Dictionary{{"XOExtension", Dictionary{}}});
  EXPECT_FALSE(make(beside, BundlePathKind::Directory).containingApplication().has_value());
  // An XOExtension that is not a dictionary makes no plug-in.
  writeVmap(beside + "/Info.vmap", Dictionary{{"XOExtension", "yes"}});
  EXPECT_FALSE(make(beside, BundlePathKind::Directory).isPlugIn());
}

TEST_F(PlatformBundleTest, ReportedPathsAreCanonical) {
  ASSERT_EQ(::symlink(app_.c_str(), (scratch_ / "Link.app").c_str()), 0);
  ASSERT_EQ(::symlink((app_ + "/X").c_str(), (scratch_ / "x-link").c_str()), 0);
  EXPECT_EQ(make(scratch_ / "Link.app/", BundlePathKind::Directory).property(kBundlePath),
            Value(app_));
  EXPECT_EQ(
      make(scratch_ / "Applications/./X.app//", BundlePathKind::Directory).property(kBundlePath),
      Value(app_));
  // A link to the executable finds the bundle the executable lives in.
  EXPECT_EQ(make(scratch_ / "x-link", BundlePathKind::Executable).property(kBundlePath),
            Value(app_));
  Result<Bundle> relative = Bundle::create("Applications/X.app", BundlePathKind::Directory);
  ASSERT_FALSE(relative.ok());
  EXPECT_TRUE(isBundleError(relative.error(), BundleErrorCode::InvalidPath));
}

TEST_F(PlatformBundleTest, MissingOrMalformedManifestLeavesNoInfoButTheError) {
  const std::string bundle = scratch_ / "M.ovx";
  services_testing::makeDirectories(bundle);
  Bundle missing = make(bundle, BundlePathKind::Directory);
  EXPECT_EQ(missing.property(kBundlePath), Value(bundle));
  EXPECT_EQ(missing.infoDictionary(), nullptr);
  ASSERT_TRUE(missing.infoError().has_value());
  EXPECT_TRUE(missing.infoError()->is(kPosixErrorDomain, ENOENT));

  writeText(bundle + "/Info.vmap", "<vmap version=\"1.0\"><dict><key>a</key></dict></vmap>");
  Bundle malformed = make(bundle, BundlePathKind::Directory);
  EXPECT_EQ(malformed.infoDictionary(), nullptr);
  ASSERT_TRUE(malformed.infoError().has_value());
  EXPECT_EQ(malformed.infoError()->domain(), vmap::kErrorDomain);
  EXPECT_FALSE(malformed.isPlugIn());

  writeVmap(bundle + "/Info.vmap", Value(Array{Value("XOExtension")}));
  Bundle array = make(bundle, BundlePathKind::Directory);
  ASSERT_TRUE(array.infoError().has_value());
  EXPECT_TRUE(isBundleError(*array.infoError(), BundleErrorCode::InfoNotADictionary));

  writeText(bundle + "/Info.vmap", std::string(Bundle::kMaxInfoBytes + 1, ' '));
  Bundle huge = make(bundle, BundlePathKind::Directory);
  ASSERT_TRUE(huge.infoError().has_value());
  EXPECT_TRUE(huge.infoError()->is(vmap::kErrorDomain,
                                   static_cast<std::int64_t>(vmap::ErrorCode::TooLarge)));

  // A file given as a bundle directory is none.
  EXPECT_FALSE(make(app_ + "/X", BundlePathKind::Directory).bundleDirectory().has_value());
}

}  // namespace
}  // namespace platform::bundle
