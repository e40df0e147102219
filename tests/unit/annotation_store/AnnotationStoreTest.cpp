// The annotation store on real files: a missing, foreign or broken file, the
// merge rules of a change, failed saves and the container lookup.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>

#include "Quorvex/QVErrors.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/vmap/VmapError.h"
#include "platform/vmap/testing/FaultyFileOps.h"
#include "qvd/QVDAnnotationStore.h"
#include "tests/unit/annotation_store/AnnotationStoreTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Dictionary;
using platform::Value;
using platform::log::Level;

class AnnotationStoreTest : public ::testing::Test {
 protected:
  void SetUp() override { platform::log::LoggerRegistry::shared().applyFilterForTesting("debug"); }
  void TearDown() override { platform::log::LoggerRegistry::shared().applyFilterForTesting(""); }

  std::unique_ptr<QVDAnnotationStore> open(
      platform::vmap::FileOps& ops = platform::vmap::FileOps::real()) {
    auto store = QVDAnnotationStore::initWithDatabase(file, containers, ops);
    EXPECT_TRUE(store.ok()) << store.error().description();
    return store.ok() ? std::move(*store) : nullptr;
  }
  std::vector<std::string> linesAt(Level level) const {
    std::vector<std::string> out;
    for (const auto& line : log.lines())
      if (line.level == level) out.push_back(line.message);
    return out;
  }

  ScratchDirectory dir;
  const std::string file = dir.path() + "/Quorvex-Annotations";
  std::shared_ptr<platform::container::FakeContainerManager> containers =
      std::make_shared<platform::container::FakeContainerManager>(dir.path() + "/containers");
  platform::log::LogCaptureForTesting log;
};

Dictionary election(int value) { return Dictionary{{"election", Value(value)}}; }

TEST_F(AnnotationStoreTest, UnusableFilesAreLoggedAndResetToAnEmptyTable) {
  struct Case {
    std::string contents;
    std::string domain;
    std::int64_t code;
    std::string message;  // the error's description, when it is known exactly
  };
  const std::string quorvex(QVQuorvexErrorDomain);
  const std::vector<Case> cases = {
      {vmapDocument("<dict><key>version</key><integer>15</integer></dict>"), quorvex, 7,
       "found database version 15 needed version 16"},
      {vmapDocument("<array/>"), quorvex, 7, "found database version 0 needed version 16"},
      {"hello, world\n", std::string(platform::vmap::kErrorDomain),
       static_cast<std::int64_t>(platform::vmap::ErrorCode::NotAVmapDocument), ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.contents);
    writeText(file, c.contents);
    log.clear();
    auto store = open();
    ASSERT_TRUE(store);
    platform::Status loaded = store->loadDb(file);
    ASSERT_FALSE(loaded.ok());
    EXPECT_EQ(loaded.error().domain(), c.domain);
    EXPECT_EQ(loaded.error().code(), c.code);
    if (!c.message.empty()) { EXPECT_EQ(loaded.error().description(), c.message); }
    const std::vector<std::string> errors = linesAt(Level::Error);
    ASSERT_EQ(errors.size(), 1u) << ::testing::PrintToString(log.messages());
    EXPECT_EQ(errors[0], "unable to load annotation database:" + store->annotationsURL() +
                             " error:" + loaded.error().description() + " (resetting)");
    EXPECT_TRUE(store->annotations().empty());
    EXPECT_EQ(readText(file), c.contents) << "a foreign file is only replaced by a change";
  }
}

TEST_F(AnnotationStoreTest, ChangesByKeyMergeEntriesAndReplaceValuesWhole) {
  auto store = open();
  ASSERT_TRUE(store);
  const Dictionary e1{{"a", Value(1)}, {"b", Value(2)}};
  const Dictionary e2{{"c", Value(3)}};
  store->setAnnotationForPlugIn(election(5), FakePlugIn("com.x.b"));
  const std::vector<std::pair<std::optional<Dictionary>, std::optional<Dictionary>>> steps = {
      {Dictionary{{"election", Value(0)}, {"extension", Value(e1)}},
       Dictionary{{"election", Value(0)}, {"extension", Value(e1)}}},
      {election(1), Dictionary{{"election", Value(1)}, {"extension", Value(e1)}}},
      {Dictionary{{"extension", Value(e2)}}, Dictionary{{"election", Value(1)}, {"extension", Value(e2)}}},
      {std::nullopt, std::nullopt},
      {std::nullopt, std::nullopt},  // removing what is not there changes nothing
  };
  for (std::size_t i = 0; i < steps.size(); ++i) {
    SCOPED_TRACE("step " + std::to_string(i));
    store->setAnnotationForPlugIn(steps[i].first, FakePlugIn("com.x.a"));
    EXPECT_EQ(store->annotationForPlugIn(FakePlugIn("com.x.a")), steps[i].second);
    const Dictionary root = rootOf(file);
    const Value expected = steps[i].second ? Value(*steps[i].second) : Value();
    EXPECT_EQ(root.get("data").dictionary()->get("com.x.a"), expected) << "the file follows";
    EXPECT_EQ(root.get("data").dictionary()->get("com.x.b"), Value(election(5)));
  }
}

TEST_F(AnnotationStoreTest, FailedSaveKeepsTheChangeForTheNextSave) {
  platform::vmap::FaultyFileOps faulty;
  auto store = open(faulty);
  ASSERT_TRUE(store);
  store->setAnnotationForPlugIn(election(1), FakePlugIn("first"));
  const std::string saved = readText(file);
  faulty.failAt(platform::vmap::FileStep::Write, ENOSPC, 2, platform::vmap::PartialWrite::Yes);
  log.clear();
  store->setAnnotationForPlugIn(election(1), FakePlugIn("second"));
  ASSERT_TRUE(faulty.fired());
  const std::vector<std::string> errors = linesAt(Level::Error);
  ASSERT_EQ(errors.size(), 1u);
  EXPECT_EQ(errors[0].rfind("unable to save annotations:" + store->annotationsURL() + " error:", 0),
            0u) << errors[0];
  EXPECT_EQ(readText(file), saved) << "the old file stays whole";
  store->setAnnotationForPlugIn(election(1), FakePlugIn("third"));
  EXPECT_EQ(rootOf(file).get("data").dictionary()->size(), 3u);
}

TEST_F(AnnotationStoreTest, ContainerFailureIsTheOnlyConstructionError) {
  containers->setFailure(platform::Error(std::string(platform::kPosixErrorDomain), EACCES));
  auto failed = QVDAnnotationStore::initWithDatabase(file, containers);
  ASSERT_FALSE(failed.ok());
  EXPECT_EQ(failed.error().description(),
            "unable to locate user container: error " + std::to_string(EACCES));
  EXPECT_EQ(linesAt(Level::Error),
            std::vector<std::string>{"failed to get storage container: error=" +
                                     std::to_string(EACCES)});
  EXPECT_FALSE(QVDAnnotationStore::initWithDatabase(file, nullptr).ok());
}

TEST_F(AnnotationStoreTest, TableFoundInTheContainerIsMigrated) {
  const std::string uidDir = dir.path() + "/containers/" + std::to_string(::getuid());
  std::filesystem::create_directories(uidDir);
  writeText(uidDir + "/com.corvane.qvd",
            vmapDocument("<dict><key>version</key><integer>16</integer><key>data</key>"
                         "<dict><key>m</key><dict/></dict></dict>"));
  ASSERT_TRUE(open());
  EXPECT_EQ(linesAt(Level::Info), std::vector<std::string>{"migrating shared annotations"});
  EXPECT_EQ(rootOf(file).get("data"), Value(Dictionary{{"m", Value(Dictionary{})}}));
}

}  // namespace
}  // namespace qvd::testing
