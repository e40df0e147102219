// Bundles built in a scratch directory: the two path kinds, the numbered
// properties, manifests missing or malformed, plug-ins and the application
// that contains them, canonical paths.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <optional>

#include "platform/bundle/Bundle.h"
#include "platform/bundle/BundleError.h"
#include "platform/vmap/VmapError.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::bundle {
namespace {

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
    writeVmap(app_ + "/Info.vmap", Dictionary{{"BXExecutable", "X"}});
    writeText(app_ + "/X", "binary");
    writeText(app_ + "/bin/tool", "binary");
  }
  services_testing::ScratchDirectory scratch_;
  const std::string app_ = scratch_ / "Applications/X.app";
};

TEST_F(PlatformBundleTest, PathsOfBothKindsFindTheApplicationCanonically) {
  ASSERT_EQ(::symlink(app_.c_str(), (scratch_ / "Link.app").c_str()), 0);
  const auto kExe = BundlePathKind::Executable;
  const auto kDir = BundlePathKind::Directory;
  const struct {
    std::string path;
    BundlePathKind kind;
    bool found;
  } cases[] = {
      {app_ + "/X", kExe, true},
      {app_ + "/bin", kExe, true},       // a directory inside, given as an executable
      {app_ + "/bin/gone", kExe, true},  // missing, but its directory exists
      {scratch_ / "Link.app/", kDir, true},
      {app_, kExe, false},         // a file in Applications/, which no bundle holds
      {app_ + "/X", kDir, false},  // a file is no bundle directory
  };
  for (const auto& c : cases) {
    Bundle bundle = make(c.path, c.kind);
    EXPECT_EQ(bundle.bundleDirectory().has_value(), c.found) << c.path;
    if (c.found) {
      EXPECT_EQ(bundle.property(kBundlePath), Value(app_)) << c.path;
      EXPECT_EQ(bundle.property(kExecutablePath), Value(app_ + "/X")) << c.path;
      EXPECT_EQ(bundle.property(kSupportFilesPath), Value(app_)) << c.path;
      EXPECT_TRUE(bundle.isApplication() && !bundle.isPlugIn()) << c.path;
      EXPECT_NE(bundle.infoDictionary(), nullptr) << c.path;
      EXPECT_FALSE(bundle.containingApplication().has_value()) << c.path;
    } else {
      for (int number : {kBundlePath, kExecutablePath, kSupportFilesPath}) {
        EXPECT_TRUE(bundle.property(number).isNone()) << c.path << " " << number;
      }
    }
  }
  ASSERT_TRUE(make(app_, kExe).infoError().has_value());
  EXPECT_TRUE(isBundleError(*make(app_, kExe).infoError(), BundleErrorCode::NoBundleDirectory));
  EXPECT_TRUE(make(app_, kDir).property(7).isNone());
  Result<Bundle> relative = Bundle::create("Applications/X.app", kDir);
  ASSERT_FALSE(relative.ok());
  EXPECT_TRUE(isBundleError(relative.error(), BundleErrorCode::InvalidPath));
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
  EXPECT_TRUE(bundle.isPlugIn() && bundle.isApplicationExtension() && !bundle.isApplication());
  std::optional<Bundle> application = bundle.containingApplication();
  ASSERT_TRUE(application.has_value());
  EXPECT_EQ(application->property(kBundlePath), Value(app_));
  EXPECT_EQ(application->property(kExecutablePath), Value(app_ + "/X"));
  EXPECT_TRUE(application->isApplication());

  const std::string beside = app_ + "/Resources/r.ovx";
  writeVmap(beside + "/Info.vmap", Dictionary{{"XOExtension", Dictionary{}}});
  EXPECT_FALSE(make(beside, BundlePathKind::Directory).containingApplication().has_value());
  // An XOExtension that is not a dictionary makes no plug-in.
  writeVmap(beside + "/Info.vmap", Dictionary{{"XOExtension", "yes"}});
  EXPECT_FALSE(make(beside, BundlePathKind::Directory).isPlugIn());
}

TEST_F(PlatformBundleTest, MissingOrMalformedManifestLeavesNoInfoButTheError) {
  const std::string bundle = scratch_ / "M.ovx";
  const std::string info = bundle + "/Info.vmap";
  services_testing::makeDirectories(bundle);
  const auto errorOf = [&](const char* what) {
    Bundle made = make(bundle, BundlePathKind::Directory);
    EXPECT_EQ(made.property(kBundlePath), Value(bundle)) << what;
    EXPECT_EQ(made.infoDictionary(), nullptr) << what;
    EXPECT_FALSE(made.isPlugIn()) << what;
    return made.infoError().value_or(Error::posix(0, what));
  };
  EXPECT_TRUE(errorOf("missing").is(kPosixErrorDomain, ENOENT));
  writeText(info, "<vmap version=\"1.0\"><dict><key>a</key></dict></vmap>");
  EXPECT_EQ(errorOf("malformed").domain(), vmap::kErrorDomain);
  writeVmap(info, Value(Array{Value("XOExtension")}));
  EXPECT_TRUE(isBundleError(errorOf("array"), BundleErrorCode::InfoNotADictionary));
  writeText(info, std::string(Bundle::kMaxInfoBytes + 1, ' '));
  EXPECT_TRUE(errorOf("huge").is(vmap::kErrorDomain,
                                 static_cast<std::int64_t>(vmap::ErrorCode::TooLarge)));
}

}  // namespace
}  // namespace platform::bundle
