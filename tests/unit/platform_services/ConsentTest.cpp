// Consent records read from files under a scratch platform root: both
// document forms, missing files, malformed records, refused identifiers and
// oversized files.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "platform/bundle/Bundle.h"
#include "platform/pvg/LinuxConsentService.h"
#include "platform/root/Root.h"
#include "platform/vmap/VmapError.h"
#include "tests/unit/platform_services/ServicesTestSupport.h"

namespace platform::pvg {
namespace {

using services_testing::ScratchDirectory;
using services_testing::writeText;
using services_testing::writeVmap;

class PlatformConsentTest : public ::testing::Test {
 protected:
  void SetUp() override {
    setRootDirectoryForTesting(root_.path());
    service_.emplace();
    setRootDirectoryForTesting("/");
  }

  // An application whose manifest (binary form, which carries any string)
  // is `info`.
  bundle::Bundle application(const std::string& name, const Dictionary& info) {
    const std::string directory = root_ / ("Applications/" + name + ".app");
    services_testing::makeDirectories(directory);
    Status written =
        vmap::writeFileAtomically(directory + "/Info.vmap", Value(info), vmap::Format::Binary);
    EXPECT_TRUE(written.ok()) << written.error().description();
    return bundle::Bundle::create(directory, bundle::BundlePathKind::Directory).value();
  }
  bundle::Bundle application(const std::string& identifier) {
    return application("App", Dictionary{{std::string(kBundleIdentifierKey), identifier}});
  }
  std::string consentFile(const std::string& identifier) const {
    return root_ / ("var/db/pvg/" + identifier + ".vmap");
  }

  ScratchDirectory root_;
  std::optional<LinuxConsentService> service_;
};

TEST_F(PlatformConsentTest, RecordsReadFromEitherFormAndAMissingFileIsNoRecords) {
  EXPECT_EQ(service_->directory(), root_ / "var/db/pvg");
  const Value stored = Array{
      Dictionary{{"service", std::string(kPVGServiceKeyboardNetwork)}, {"granted", true}},
      Dictionary{{"service", "kPVGServiceCamera"}, {"granted", false}},
      Dictionary{{"service", "kPVGServicePhotos"}},
  };
  const std::vector<ConsentRecord> expected = {
      {std::string(kPVGServiceKeyboardNetwork), true},
      {"kPVGServiceCamera", false},
      {"kPVGServicePhotos", std::nullopt},
  };
  writeVmap(consentFile("com.example.xml"), stored);
  services_testing::makeDirectories(root_ / "var/db/pvg");
  ASSERT_TRUE(
      vmap::writeFileAtomically(consentFile("com.example.bin"), stored, vmap::Format::Binary).ok());
  for (const char* identifier : {"com.example.xml", "com.example.bin"}) {
    Result<std::vector<ConsentRecord>> records =
        service_->consentRecordsForBundle(application(identifier));
    ASSERT_TRUE(records.ok()) << identifier << ": " << records.error().description();
    EXPECT_EQ(*records, expected) << identifier;
  }

  Result<std::vector<ConsentRecord>> none =
      service_->consentRecordsForBundle(application("com.example.never"));
  ASSERT_TRUE(none.ok()) << none.error().description();
  EXPECT_TRUE(none->empty());
  // A name that exists but is no file is a failure, not "nothing recorded".
  services_testing::makeDirectories(consentFile("com.example.dir"));
  EXPECT_FALSE(service_->consentRecordsForBundle(application("com.example.dir")).ok());
}

TEST_F(PlatformConsentTest, MalformedRecordsAreSkippedAndMalformedDocumentsRefused) {
  writeVmap(consentFile("com.example.mixed"),
            Array{
                7,
                Dictionary{{"granted", true}},                        // no service
                Dictionary{{"service", 42}, {"granted", true}},       // service not a string
                Dictionary{{"service", "a"}, {"granted", "yes"}},     // granted not a boolean
                Array{Dictionary{{"service", "nested"}}},
                Dictionary{{"service", "b"}, {"granted", 1}},         // a number is no boolean
                Dictionary{{"service", "c"}, {"granted", true}, {"extra", Array{1, 2}}},
                Dictionary{{"service", "d"}, {"granted", true}},
            });
  Result<std::vector<ConsentRecord>> records =
      service_->consentRecordsForBundle(application("com.example.mixed"));
  ASSERT_TRUE(records.ok()) << records.error().description();
  EXPECT_EQ(*records, (std::vector<ConsentRecord>{
                          {"a", std::nullopt}, {"b", std::nullopt}, {"c", true}, {"d", true}}));

  // Past the record limit the rest is ignored, counting kept records only.
  LinuxConsentService limited(root_ / "var/db/pvg", {.maxRecords = 2});
  records = limited.consentRecordsForBundle(application("com.example.mixed"));
  ASSERT_TRUE(records.ok()) << records.error().description();
  EXPECT_EQ(*records, (std::vector<ConsentRecord>{{"a", std::nullopt}, {"b", std::nullopt}}));

  writeVmap(consentFile("com.example.dict"),
            Dictionary{{"service", "a"}, {"granted", true}});
  records = service_->consentRecordsForBundle(application("com.example.dict"));
  ASSERT_FALSE(records.ok());
  EXPECT_TRUE(isConsentError(records.error(), ConsentErrorCode::NotAnArray))
      << records.error().description();

  writeText(consentFile("com.example.broken"), "<vmap version=\"1.0\"><array><dict>");
  records = service_->consentRecordsForBundle(application("com.example.broken"));
  ASSERT_FALSE(records.ok());
  EXPECT_EQ(records.error().domain(), vmap::kErrorDomain) << records.error().description();
}

TEST_F(PlatformConsentTest, BadIdentifiersAndOversizedFilesAreRefused) {
  const std::string longest(250, 'i');
  for (const std::string& identifier :
       {std::string(), std::string("."), std::string(".."), std::string("a/b"),
        std::string("../escape"), std::string("nul\0x", 5), longest + "i"}) {
    Result<std::vector<ConsentRecord>> records =
        service_->consentRecordsForBundle(application(identifier));
    ASSERT_FALSE(records.ok()) << identifier;
    EXPECT_TRUE(isConsentError(records.error(), ConsentErrorCode::InvalidBundleIdentifier))
        << identifier << ": " << records.error().description();
  }
  EXPECT_TRUE(service_->consentRecordsForBundle(application(longest)).ok());

  const bundle::Bundle unnamed[] = {
      application("NoIdentifier", Dictionary{{"BXExecutable", "X"}}),
      application("NumberIdentifier", Dictionary{{std::string(kBundleIdentifierKey), 12}}),
      bundle::Bundle::create(root_ / "Applications/NoManifest.app",
                             bundle::BundlePathKind::Directory)
          .value(),
  };
  for (const bundle::Bundle& bundle : unnamed) {
    Result<std::vector<ConsentRecord>> records = service_->consentRecordsForBundle(bundle);
    ASSERT_FALSE(records.ok());
    EXPECT_TRUE(isConsentError(records.error(), ConsentErrorCode::NoBundleIdentifier))
        << records.error().description();
  }

  // A valid document of exactly 1 MiB is read; one byte more is refused.
  const std::string shell = services_testing::vmapText(
      Array{Dictionary{{"service", ""}, {"granted", true}}});
  const std::size_t limit = std::size_t{1} << 20;
  ASSERT_LT(shell.size(), limit);
  const std::string padding(limit - shell.size(), 's');
  writeText(consentFile("com.example.full"),
            services_testing::vmapText(Array{Dictionary{{"service", padding}, {"granted", true}}}));
  Result<std::vector<ConsentRecord>> records =
      service_->consentRecordsForBundle(application("com.example.full"));
  ASSERT_TRUE(records.ok()) << records.error().description();
  ASSERT_EQ(records->size(), 1u);
  EXPECT_EQ(records->front().service.size(), padding.size());

  writeText(consentFile("com.example.over"),
            services_testing::vmapText(
                Array{Dictionary{{"service", padding + "s"}, {"granted", true}}}));
  records = service_->consentRecordsForBundle(application("com.example.over"));
  ASSERT_FALSE(records.ok());
  EXPECT_TRUE(records.error().is(vmap::kErrorDomain,
                                 static_cast<std::int64_t>(vmap::ErrorCode::TooLarge)))
      << records.error().description();
}

}  // namespace
}  // namespace platform::pvg
