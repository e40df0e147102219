// The annotation store on real files: starting with a missing, foreign or
// broken file, the merge rules of a change, sharing by annotation key,
// persistence across restarts, failed saves and the container lookup.
#include <gtest/gtest.h>
#include <unistd.h>

#include <cerrno>
#include <cstring>
#include <filesystem>
#include <memory>
#include <optional>
#include <string>
#include <vector>

#include "Quorvex/QVErrors.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/container/testing/FakeContainerManager.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "platform/vmap/VmapError.h"
#include "platform/vmap/testing/FaultyFileOps.h"
#include "qvd/QVDAnnotationConstants.h"
#include "qvd/QVDAnnotationStore.h"
#include "tests/unit/annotation_store/AnnotationStoreTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Dictionary;
using platform::Value;
using platform::log::CapturedLine;
using platform::log::Level;

class AnnotationStoreTest : public ::testing::Test {
 protected:
  void SetUp() override { platform::log::LoggerRegistry::shared().applyFilterForTesting("debug"); }
  void TearDown() override { platform::log::LoggerRegistry::shared().applyFilterForTesting(""); }

  std::unique_ptr<QVDAnnotationStore> open(
      platform::vmap::FileOps& ops = platform::vmap::FileOps::real()) {
    auto store = QVDAnnotationStore::initWithDatabase(file, containers, ops);
    if (!store.ok()) {
      ADD_FAILURE() << store.error().description();
      return nullptr;
    }
    return std::move(*store);
  }

  std::vector<std::string> linesAt(Level level) const {
    std::vector<std::string> out;
    for (const CapturedLine& line : log.lines())
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

TEST_F(AnnotationStoreTest, FirstStartUnderThePlatformRootIsSilentAndWritesNothingUntilAChange) {
  const std::string previousRoot = platform::rootDirectory();
  platform::setRootDirectoryForTesting(dir.path());
  std::filesystem::create_directories(dir.path() + "/var/db");
  // The real container manager: the container is a directory, which the
  // migration cannot read as a file, and that must stay harmless.
  auto real = std::make_shared<platform::container::LinuxContainerManager>(dir.path() + "/User");
  auto made = QVDAnnotationStore::initWithDatabase(std::nullopt, real);
  platform::setRootDirectoryForTesting(previousRoot);
  ASSERT_TRUE(made.ok()) << made.error().description();
  QVDAnnotationStore& store = **made;
  const std::string path = dir.path() + "/var/db/Quorvex-Annotations";
  EXPECT_EQ(store.annotationsPath(), path);
  EXPECT_EQ(store.annotationsURL(), "file://" + path);

  EXPECT_TRUE(std::filesystem::is_directory(
      dir.path() + "/User/" + std::to_string(::getuid()) + "/com.corvane.qvd"));
  EXPECT_TRUE(linesAt(Level::Error).empty()) << ::testing::PrintToString(log.messages());
  EXPECT_TRUE(store.annotations().empty());
  EXPECT_FALSE(std::filesystem::exists(path));

  store.setAnnotationForPlugIn(election(1), FakePlugIn("com.x.a"));
  const Dictionary root = rootOf(path);
  EXPECT_EQ(root.get("version"), Value(16));
  EXPECT_EQ(root.get("data"), Value(Dictionary{{"com.x.a", Value(election(1))}}));
}

TEST_F(AnnotationStoreTest, UnusableFilesAreLoggedAndResetToAnEmptyTable) {
  const std::string data = "<key>data</key><dict><key>old</key><dict/></dict>";
  struct Case {
    std::string name;
    std::string contents;
    std::string domain;
    std::int64_t code;
    std::string message;  // the error's description, when it is known exactly
  };
  const std::string quorvex(QVQuorvexErrorDomain);
  const std::string vmap(platform::vmap::kErrorDomain);
  const std::vector<Case> cases = {
      {"version 15", vmapDocument("<dict><key>version</key><integer>15</integer>" + data + "</dict>"),
       quorvex, 7, "found database version 15 needed version 16"},
      {"no version", vmapDocument("<dict>" + data + "</dict>"), quorvex, 7,
       "found database version 0 needed version 16"},
      {"array root", vmapDocument("<array/>"), quorvex, 7,
       "found database version 0 needed version 16"},
      {"not a document", "hello, world\n", vmap,
       static_cast<std::int64_t>(platform::vmap::ErrorCode::NotAVmapDocument), ""},
      {"cut short", vmapDocument("<dict><key>version</key><integer>16</integer>").substr(0, 80),
       vmap, static_cast<std::int64_t>(platform::vmap::ErrorCode::MalformedXml), ""},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.name);
    writeText(file, c.contents);
    log.clear();
    auto store = open();
    ASSERT_TRUE(store);

    platform::Status loaded = store->loadDb(file);
    ASSERT_FALSE(loaded.ok());
    EXPECT_EQ(loaded.error().domain(), c.domain);
    EXPECT_EQ(loaded.error().code(), c.code);
    const std::vector<std::string> errors = linesAt(Level::Error);
    ASSERT_EQ(errors.size(), 1u) << ::testing::PrintToString(log.messages());
    EXPECT_EQ(errors[0], "unable to load annotation database:" + store->annotationsURL() +
                             " error:" + loaded.error().description() + " (resetting)");
    if (!c.message.empty()) {
      EXPECT_EQ(loaded.error().description(), c.message);
    }

    EXPECT_TRUE(store->annotations().empty());
    EXPECT_EQ(readText(file), c.contents) << "a foreign file is only replaced by a change";
    store->setAnnotationForPlugIn(election(1), FakePlugIn("new"));
    const Dictionary root = rootOf(file);
    EXPECT_EQ(root.get("version"), Value(16));
    EXPECT_EQ(root.get("data"), Value(Dictionary{{"new", Value(election(1))}}));
  }
}

TEST_F(AnnotationStoreTest, Version16DocumentsLoadWhateverTheirData) {
  struct Case {
    std::string root;
    Dictionary expected;
  };
  const std::vector<Case> cases = {
      {"<dict><key>version</key><integer>16</integer></dict>", {}},
      {"<dict><key>version</key><integer>16</integer><key>data</key><string>x</string></dict>", {}},
      {"<dict><key>data</key><dict><key>a</key><dict><key>election</key><integer>1</integer>"
       "</dict></dict><key>version</key><real>16</real></dict>",
       {{"a", Value(election(1))}}},
  };
  for (const Case& c : cases) {
    SCOPED_TRACE(c.root);
    writeText(file, vmapDocument(c.root));
    log.clear();
    auto store = open();
    ASSERT_TRUE(store);
    EXPECT_TRUE(linesAt(Level::Error).empty()) << ::testing::PrintToString(log.messages());
    EXPECT_EQ(store->annotations(), c.expected);
  }
}

TEST_F(AnnotationStoreTest, ChangesByKeyMergeEntriesAndReplaceValuesWhole) {
  auto store = open();
  ASSERT_TRUE(store);
  // Plug-ins with one key share one annotation: each step changes it
  // through a fresh plug-in and reads it back through another.
  const FakePlugIn plugIn("com.x.a");
  const FakePlugIn other("com.x.b");
  const Dictionary e1{{"a", Value(1)}, {"b", Value(2)}};
  const Dictionary e2{{"c", Value(3)}};
  store->setAnnotationForPlugIn(election(5), other);

  struct Step {
    std::optional<Dictionary> change;
    std::optional<Dictionary> expected;
  };
  const std::vector<Step> steps = {
      {Dictionary{{"election", Value(0)}, {"extension", Value(e1)}},
       Dictionary{{"election", Value(0)}, {"extension", Value(e1)}}},
      {election(1), Dictionary{{"election", Value(1)}, {"extension", Value(e1)}}},
      {Dictionary{{"extension", Value(e2)}}, Dictionary{{"election", Value(1)}, {"extension", Value(e2)}}},
      {Dictionary{{"anything", Value("kept as given")}},
       Dictionary{{"election", Value(1)}, {"extension", Value(e2)}, {"anything", Value("kept as given")}}},
      {std::nullopt, std::nullopt},
      {std::nullopt, std::nullopt},  // removing what is not there changes nothing
  };
  for (std::size_t i = 0; i < steps.size(); ++i) {
    SCOPED_TRACE("step " + std::to_string(i));
    store->setAnnotationForPlugIn(steps[i].change, FakePlugIn("com.x.a"));
    EXPECT_EQ(store->annotationForPlugIn(plugIn), steps[i].expected);
    EXPECT_EQ(store->annotations().size(), steps[i].expected ? 2u : 1u);
    // The file follows every change, and the other plug-in is untouched.
    const Dictionary root = rootOf(file);
    const Dictionary* data = root.get("data").dictionary();
    ASSERT_NE(data, nullptr);
    EXPECT_EQ(data->contains("com.x.a"), steps[i].expected.has_value());
    if (steps[i].expected) {
      EXPECT_EQ(data->get("com.x.a"), Value(*steps[i].expected));
    }
    EXPECT_EQ(data->get("com.x.b"), Value(election(5)));
  }
  EXPECT_TRUE(linesAt(Level::Error).empty());
}

TEST_F(AnnotationStoreTest, AnnotationsSurviveARestart) {
  const Dictionary extension{{"list", Value(platform::Array{Value("a"), Value(2.5)})},
                             {"flag", Value(true)}};
  std::size_t lookups = 0;
  {
    auto first = open();
    ASSERT_TRUE(first);
    first->setAnnotationForPlugIn(election(1), FakePlugIn("a"));
    first->setAnnotationForPlugIn(Dictionary{{"extension", Value(extension)}}, FakePlugIn("b"));
    first->setAnnotationForPlugIn(election(1), FakePlugIn("gone"));
    first->setAnnotationForPlugIn(std::nullopt, FakePlugIn("gone"));
    lookups = containers->requests().size();
  }
  auto second = open();
  ASSERT_TRUE(second);
  EXPECT_EQ(second->annotations(),
            (Dictionary{{"a", Value(election(1))}, {"b", Value(Dictionary{{"extension", Value(extension)}})}}));
  EXPECT_EQ(containers->requests().size(), lookups) << "a loadable file needs no container";
  EXPECT_TRUE(linesAt(Level::Error).empty());
}

TEST_F(AnnotationStoreTest, FailedSaveKeepsTheChangeForTheNextSave) {
  struct Case {
    platform::vmap::FileStep step;
    int err;
  };
  using platform::vmap::FileStep;
  const std::vector<Case> cases = {{FileStep::Write, ENOSPC}, {FileStep::Rename, EIO}};
  for (const Case& c : cases) {
    SCOPED_TRACE(platform::vmap::fileStepName(c.step));
    std::filesystem::remove(file);
    platform::vmap::FaultyFileOps faulty;
    auto store = open(faulty);
    ASSERT_TRUE(store);
    store->setAnnotationForPlugIn(election(1), FakePlugIn("first"));
    const std::string saved = readText(file);

    faulty.failAt(c.step, c.err, 2, platform::vmap::PartialWrite::Yes);
    log.clear();
    store->setAnnotationForPlugIn(election(1), FakePlugIn("second"));
    ASSERT_TRUE(faulty.fired());
    const std::vector<std::string> errors = linesAt(Level::Error);
    ASSERT_EQ(errors.size(), 1u);
    EXPECT_EQ(errors[0].rfind("unable to save annotations:" + store->annotationsURL() + " error:", 0),
              0u) << errors[0];
    EXPECT_NE(errors[0].find(std::strerror(c.err)), std::string::npos) << errors[0];
    EXPECT_EQ(readText(file), saved) << "the old file stays whole";
    EXPECT_EQ(store->annotationForIdentifier("second"), election(1));

    store->setAnnotationForPlugIn(election(1), FakePlugIn("third"));
    EXPECT_EQ(rootOf(file).get("data"),
              Value(Dictionary{{"first", Value(election(1))},
                               {"second", Value(election(1))},
                               {"third", Value(election(1))}}));
  }
}

TEST_F(AnnotationStoreTest, ContainerFailureIsTheOnlyConstructionError) {
  containers->setFailure(platform::Error(std::string(platform::kPosixErrorDomain), EACCES));
  auto failed = QVDAnnotationStore::initWithDatabase(file, containers);
  ASSERT_FALSE(failed.ok());
  EXPECT_EQ(failed.error().code(), EACCES);
  EXPECT_EQ(failed.error().description(),
            "unable to locate user container: error " + std::to_string(EACCES));
  EXPECT_EQ(linesAt(Level::Error),
            std::vector<std::string>{"failed to get storage container: error=" +
                                     std::to_string(EACCES)});

  auto none = QVDAnnotationStore::initWithDatabase(file, nullptr);
  ASSERT_FALSE(none.ok());
  EXPECT_NE(none.error().description().find("unable to locate user container"), std::string::npos);
}

TEST_F(AnnotationStoreTest, TableFoundInTheContainerIsMigrated) {
  const std::string container =
      dir.path() + "/containers/" + std::to_string(::getuid()) + "/com.corvane.qvd";
  std::filesystem::create_directories(dir.path() + "/containers/" + std::to_string(::getuid()));
  writeText(container, vmapDocument("<dict><key>version</key><integer>16</integer><key>data</key>"
                                    "<dict><key>m</key><dict/></dict></dict>"));
  {
    auto store = open();
    ASSERT_TRUE(store);
    EXPECT_EQ(linesAt(Level::Info), std::vector<std::string>{"migrating shared annotations"});
    EXPECT_EQ(rootOf(file).get("data"), Value(Dictionary{{"m", Value(Dictionary{})}}));
  }

  // The migrated table is kept even when it cannot be written.
  log.clear();
  const std::string unwritable = dir.path() + "/no-such-directory/Quorvex-Annotations";
  auto made = QVDAnnotationStore::initWithDatabase(unwritable, containers);
  ASSERT_TRUE(made.ok());
  const std::vector<std::string> errors = linesAt(Level::Error);
  ASSERT_EQ(errors.size(), 1u) << ::testing::PrintToString(log.messages());
  EXPECT_EQ(errors[0].rfind("unable to save migrated annotations to " + (*made)->annotationsURL() +
                                " error:", 0),
            0u) << errors[0];
  EXPECT_EQ((*made)->annotationForIdentifier("m"), Dictionary{});
  EXPECT_FALSE(std::filesystem::exists(dir.path() + "/no-such-directory"));
}

}  // namespace
}  // namespace qvd::testing
