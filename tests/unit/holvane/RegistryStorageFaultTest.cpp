// A full or failing disk under the registration database. SQLite's file
// layer is swapped for one that fails the Nth write, sync, truncate or
// read: every change the registry acknowledged must survive, every change
// it refused must be absent, the file must never be taken for a damaged
// one, and the registry must work again once the disk does.
#include <gtest/gtest.h>

#include <array>
#include <filesystem>
#include <functional>
#include <map>
#include <optional>

#include "platform/holvane/RegistryError.h"
#include "platform/holvane/testing/FaultingSqliteVfs.h"
#include "platform/vmap/Writer.h"
#include "tests/unit/holvane/HolvaneTestSupport.h"

namespace platform::holvane {
namespace {

using testing::openRegistry;
using testing::plugInInfo;
using testing::RegistryUnderTest;
using testing::SystemRoot;
using testing::tryOpenRegistry;
using testing::writeApplication;
using testing::writeText;

constexpr SqliteOperation kOperations[] = {SqliteOperation::Write, SqliteOperation::Sync,
                                           SqliteOperation::Truncate, SqliteOperation::Read};
constexpr const char* kNames[] = {"write", "sync", "truncate", "read"};  // by operation
constexpr SqliteFault kFaults[] = {SqliteFault::NoSpace, SqliteFault::Io};

std::string describe(SqliteOperation operation, SqliteFault fault, std::uint64_t k) {
  return std::string(fault == SqliteFault::NoSpace ? "ENOSPC" : "EIO") + " at " +
         kNames[static_cast<int>(operation)] + " #" + std::to_string(k);
}

// The calls a sweep over `count` of them fails: each of the first 40, then
// about 20 more spread over the rest, and the last.
std::vector<std::uint64_t> callsToFail(std::uint64_t count) {
  std::vector<std::uint64_t> calls;
  const std::uint64_t stride = std::max<std::uint64_t>(1, count / 20);
  for (std::uint64_t k = 1; k <= count; k += k < 40 ? 1 : stride) calls.push_back(k);
  if (!calls.empty() && calls.back() != count) calls.push_back(count);
  return calls;
}

// Runs once with no fault to count each operation's calls, then once per
// fault and call to fail, until a run fails the test. `run` answers the
// calls of the operation it is given. Answers the counts.
using Run =
    std::function<std::uint64_t(std::optional<SqliteFault>, SqliteOperation, std::uint64_t)>;
std::array<std::uint64_t, 4> sweep(const Run& run) {
  std::array<std::uint64_t, 4> counts{};
  int tried = 0;
  for (SqliteOperation operation : kOperations) {
    const std::uint64_t count = run(std::nullopt, operation, 0);
    counts[static_cast<int>(operation)] = count;
    ::testing::Test::RecordProperty(std::string(kNames[static_cast<int>(operation)]) + "s",
                                    static_cast<int>(count));
    for (SqliteFault fault : kFaults) {
      // A read cannot run out of space.
      if (operation == SqliteOperation::Read && fault == SqliteFault::NoSpace) continue;
      for (std::uint64_t k : callsToFail(count)) {
        run(fault, operation, k);
        ++tried;
        if (::testing::Test::HasFailure()) return counts;  // its failures say it all
      }
    }
  }
  ::testing::Test::RecordProperty("combinations", tried);
  return counts;
}

bool movedAside(const SystemRoot& root) {
  for (const auto& entry : std::filesystem::directory_iterator(root / "var/db/holvane")) {
    if (entry.path().filename().string().starts_with("registry.sqlite.corrupt-")) return true;
  }
  return false;
}

// What the file must hold for each bundle path: none when it must be absent.
struct Stored {
  Uuid uuid;
  std::string identifier;
};
using Expected = std::map<std::string, std::optional<Stored>>;

enum class Action { Register, Unregister, Rename };
struct Step {
  Action action;
  const char* bundle;
};
// Changes of every kind: new records, a removal, a record changed in place.
constexpr Step kScenario[] = {{Action::Register, "A"}, {Action::Register, "B"},
                              {Action::Register, "C"}, {Action::Unregister, "B"},
                              {Action::Rename, "C"},   {Action::Register, "D"}};

class RegistryStorageFaultTest : public ::testing::Test {
 protected:
  static std::string bundle(const SystemRoot& root, const std::string& name) {
    return root / ("Applications/Host.app/PlugIns/" + name + ".ovx");
  }
  // Written plainly: a sweep rewrites bundles hundreds of times, and the
  // atomic writer's syncs would cost more than everything else.
  static void writeBundle(const SystemRoot& root, const std::string& name, Dictionary extras = {}) {
    Result<std::string> text =
        vmap::write(plugInInfo("com.example." + name, "com.example.point", std::move(extras)),
                    vmap::Format::Xml);
    ASSERT_TRUE(text.ok());
    writeText(bundle(root, name) + "/Info.vmap", *text);
  }
  static void writeBundles(const SystemRoot& root) {
    writeApplication(root / "Applications/Host.app", "com.example.host");
    for (const char* name : {"A", "B", "C", "D", "Probe", "Late"}) writeBundle(root, name);
  }
  // Puts the files kept in `image` in place of the registry's database:
  // cheaper than making one afresh, which costs SQLite several syncs.
  static void restoreDatabase(const SystemRoot& root, const std::string& image) {
    std::filesystem::remove_all(root / "var/db/holvane");
    std::filesystem::copy(image, root / "var/db/holvane");
  }

  // Runs `step`; `expected` learns what an acknowledged one stored. A
  // refused one must have failed as storage, nothing else. Removing a
  // bundle whose registration was refused finds nothing, rightly.
  static bool apply(LinuxRegistry& registry, const SystemRoot& root, const Step& step,
                    Expected& expected) {
    const std::string path = bundle(root, step.bundle);
    if (step.action == Action::Unregister) {
      const bool stored = expected[path].has_value();
      const Status removed = registry.unregisterPlugIn(path);
      if (removed.ok() || !stored) {
        EXPECT_EQ(removed.ok(), stored) << path;
        expected[path] = std::nullopt;
        return true;
      }
      EXPECT_TRUE(isRegistryError(removed.error(), RegistryErrorCode::Storage))
          << removed.error().description();
      return false;
    }
    if (step.action == Action::Rename) {
      writeBundle(root, step.bundle, Dictionary{{"XOExtensionIdentifier", "renamed"}});
    }
    const Result<PlugInRecord> registered = registry.registerPlugIn(path);
    if (!registered.ok()) {
      EXPECT_TRUE(isRegistryError(registered.error(), RegistryErrorCode::Storage))
          << registered.error().description();
      return false;
    }
    expected[path] = Stored{registered->uuid, registered->identifier};
    return true;
  }

  static void expectHolds(LinuxRegistry& registry, const Expected& expected) {
    for (const auto& [path, stored] : expected) {
      const Result<std::optional<PlugInRecord>> found = registry.plugInByPath(path);
      ASSERT_TRUE(found.ok()) << found.error().description();
      ASSERT_EQ(found->has_value(), stored.has_value()) << path;
      if (!stored) continue;
      EXPECT_EQ((*found)->uuid, stored->uuid) << path;
      EXPECT_EQ((*found)->identifier, stored->identifier) << path;
    }
  }

  FaultingSqliteVfs vfs_;  // made first, gone last: outlives every connection
};

// The scenario over a fresh database, with a fault armed from its first
// change on, the close included. After the first refused change the disk recovers
// and the next registration must go through: a transaction left open by the
// failure would refuse it. Then a restart must find exactly the
// acknowledged changes, the last generation, and a working registry.
TEST_F(RegistryStorageFaultTest, AcknowledgedChangesSurviveAFailingDisk) {
  SystemRoot root;
  writeBundles(root);
  openRegistry(root);  // an empty database, closed again
  const std::string empty = root / "empty";
  std::filesystem::copy(root / "var/db/holvane", empty);
  // Returns the calls of `operation` the scenario made, from its first
  // change to the end of the close.
  auto run = [&](std::optional<SqliteFault> fault, SqliteOperation operation, std::uint64_t k) {
    SCOPED_TRACE(fault ? describe(operation, *fault, k) : "no fault");
    restoreDatabase(root, empty);
    writeBundle(root, "C");  // as it was before the scenario renamed it
    Expected expected;
    std::vector<std::string> acknowledged;
    std::vector<std::string> heard;
    Uuid generation;
    std::uint64_t calls = 0;
    const std::uint64_t injected = vfs_.injected();
    {
      RegistryUnderTest opened = openRegistry(root);
      if (opened.registry == nullptr) return calls;
      LinuxRegistry& registry = *opened.registry;
      registry.addInstallObserver(
          [&](const PlugInRecord& record) { heard.push_back(record.path); });
      calls = vfs_.calls(operation);
      if (fault) vfs_.failAt(operation, k, *fault, FaultPersistence::UntilCleared);
      bool recovered = false;
      for (const Step& step : kScenario) {
        const Uuid before = registry.generation();
        if (apply(registry, root, step, expected)) {
          if (step.action != Action::Unregister) acknowledged.push_back(bundle(root, step.bundle));
          continue;
        }
        EXPECT_EQ(registry.generation(), before) << "refusing " << step.bundle << " changed it";
        EXPECT_FALSE(recovered) << step.bundle << " refused after the disk recovered";
        vfs_.clear();
        recovered = true;
        EXPECT_TRUE(apply(registry, root, {Action::Register, "Probe"}, expected))
            << "no change goes through after " << step.bundle << " was refused";
        acknowledged.push_back(bundle(root, "Probe"));
      }
      generation = registry.generation();
      EXPECT_EQ(heard, acknowledged) << "install observers out of step with the file";
    }
    calls = vfs_.calls(operation) - calls;
    const bool fired = vfs_.injected() > injected;
    vfs_.clear();
    EXPECT_FALSE(movedAside(root));
    RegistryUnderTest reopened = openRegistry(root);
    if (reopened.registry == nullptr) return calls;
    expectHolds(*reopened.registry, expected);
    EXPECT_EQ(reopened.registry->generation(), generation);
    EXPECT_TRUE(apply(*reopened.registry, root, {Action::Register, "Late"}, expected));
    EXPECT_EQ(fired, fault.has_value());
    return calls;
  };

  const std::array<std::uint64_t, 4> counts = sweep(run);
  EXPECT_GT(counts[static_cast<int>(SqliteOperation::Write)], 0u);
  EXPECT_GT(counts[static_cast<int>(SqliteOperation::Sync)], 0u);
}

// A good file opened while the disk fails: the open may fail (the daemon
// reports it and stops), but the file must not be taken for a damaged one
// and replaced, and must open with everything in it once the disk recovers.
// It is a crash image, its changes still in the write-ahead log, which
// replacing it would lose outright; and opening runs a registration pass
// with new bundles to store, so that there are writes to fail too.
TEST_F(RegistryStorageFaultTest, FailedOpenLeavesAGoodFileAlone) {
  SystemRoot root;
  writeBundles(root);
  const std::string directory = root / "var/db/holvane";
  const std::string image = root / "image";
  Expected expected;
  Uuid generation;
  {
    RegistryUnderTest opened = openRegistry(root);
    ASSERT_NE(opened.registry, nullptr);
    for (const char* name : {"A", "B", "C"}) {
      ASSERT_TRUE(apply(*opened.registry, root, {Action::Register, name}, expected));
    }
    generation = opened.registry->generation();
    std::filesystem::create_directories(image);
    for (const char* file : {"/registry.sqlite", "/registry.sqlite-wal"}) {
      std::filesystem::copy_file(directory + file, image + file);
    }
  }
  const std::string added = bundle(root, "D");  // one the pass stores

  // Returns the calls of `operation` the open made.
  auto run = [&](std::optional<SqliteFault> fault, SqliteOperation operation, std::uint64_t k) {
    SCOPED_TRACE(fault ? describe(operation, *fault, k) : "no fault");
    restoreDatabase(root, image);
    const std::uint64_t before = vfs_.calls(operation);
    const std::uint64_t injected = vfs_.injected();
    if (fault) vfs_.failAt(operation, k, *fault, FaultPersistence::UntilCleared);
    std::uint64_t calls = 0;
    bool opened = false;
    {
      Result<RegistryUnderTest> faulted = tryOpenRegistry(root, StartupScan::Run);
      calls = vfs_.calls(operation) - before;
      opened = faulted.ok();
      if (!opened) {
        EXPECT_TRUE(isRegistryError(faulted.error(), RegistryErrorCode::Storage))
            << faulted.error().description();
      }
    }
    EXPECT_EQ(vfs_.injected() > injected, fault.has_value());
    vfs_.clear();
    EXPECT_FALSE(movedAside(root));
    RegistryUnderTest reopened = openRegistry(root);
    if (reopened.registry == nullptr) return calls;
    expectHolds(*reopened.registry, expected);
    const Result<std::optional<PlugInRecord>> stored = reopened.registry->plugInByPath(added);
    EXPECT_EQ(stored.ok() && stored->has_value(), opened);
    if (!opened) {
      EXPECT_EQ(reopened.registry->generation(), generation);
    }
    return calls;
  };

  const std::array<std::uint64_t, 4> counts = sweep(run);
  EXPECT_GT(counts[static_cast<int>(SqliteOperation::Read)], 0u);
  EXPECT_GT(counts[static_cast<int>(SqliteOperation::Write)], 0u);
}

}  // namespace
}  // namespace platform::holvane
