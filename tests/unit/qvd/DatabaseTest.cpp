// The plug-in database over a fake registration service: cache rules, the
// election filter, and the look-ups by UUID, location and application.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <array>
#include <filesystem>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "platform/root/Root.h"
#include "qvd/QVDAnnotationConstants.h"
#include "qvd/QVDatabase.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using platform::holvane::ApplicationRecord;
using platform::holvane::PlugInRecord;

std::string K(std::string_view key) { return std::string(key); }

struct TestDatabase final : QVDatabase {
  using QVDatabase::initDatabase;
};

struct AnnotationKey final : QVDAnnotated {
  explicit AnnotationKey(std::string k) : key(std::move(k)) {}
  std::string annotationKey() const override { return key; }
  std::string key;
};

class DatabaseTest : public ::testing::Test {
 protected:
  void SetUp() override {
    (void)testRoot();
    static std::atomic<int> serial{0};
    annotations_ = platform::rootPath("db-annotations-" + std::to_string(::getpid()) + "-" +
                                      std::to_string(++serial));
    ASSERT_TRUE(db_.initDatabase(annotations_, fakes_.platform()).ok());
  }
  void TearDown() override { std::filesystem::remove(annotations_); }

  // A record that passes validation.
  PlugInRecord record(const std::string& name, Dictionary entitlements = {}) {
    PlugInRecord r;
    r.uuid = Uuid::generate();
    r.path = platform::rootPath("System/Library/PlugIns/" + name + ".ovx");
    r.identifier = "com.example." + name;
    r.originalIdentifier = r.identifier;
    r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
    r.entitlements = std::move(entitlements);
    r.info = Dictionary{{"XOExtension", Dictionary{{"XOExtensionProtocol", "p"},
                                                   {"XOExtensionAttributes", Dictionary{}}}}};
    return r;
  }
  PlugInRecord put(PlugInRecord r) { return fakes_.registry->put(r), r; }
  void annotate(const std::string& identifier, Value election) {
    db_.annotationStore().setAnnotationForPlugIn(
        Dictionary{{std::string(QVAnnotationElectionKey), std::move(election)}},
        AnnotationKey(identifier));
  }
  // The identifiers findPlugIns() answers, sorted; "none" for no set.
  std::vector<std::string> found(const std::optional<Dictionary>& query) {
    auto set = db_.findPlugIns(query);
    if (!set) return {"none"};
    std::vector<std::string> ids;
    for (const auto& plugIn : *set) ids.push_back(plugIn->identifier().value_or("?"));
    std::sort(ids.begin(), ids.end());
    return ids;
  }

  FakePlatform fakes_;
  TestDatabase db_;
  std::string annotations_;
};

TEST_F(DatabaseTest, CacheLimitPurgesTheWholeCacheOnlyWhenExceeded) {
  // {limit, creations, entries afterwards}: the purge runs before the
  // insertion, so a cache may hold limit + 1.
  const std::vector<std::array<int, 3>> cases = {{0, 3, 1}, {2, 3, 3}, {2, 4, 1}};
  for (const auto& [limit, creations, cached] : cases) {
    db_.syncQueue()->sync([&] { db_.purgeCachesToLimit(0); });
    db_.setCacheLimit(limit);
    for (int i = 0; i < creations; ++i) {
      ASSERT_NE(db_.plugInForProxy(put(record("limit" + std::to_string(i)))), nullptr);
    }
    EXPECT_EQ(db_.cacheCount(), std::size_t(cached)) << "limit " << limit << ", " << creations;
  }
}

TEST_F(DatabaseTest, CacheHitsAndRefusals) {
  const PlugInRecord a = put(record("a"));
  auto first = db_.plugInForProxy(a);
  ASSERT_NE(first, nullptr);
  EXPECT_EQ(db_.plugInForProxy(a), first);
  EXPECT_EQ(db_.findPlugIn(a.uuid), first);

  PlugInRecord noUuid = record("nouuid");
  noUuid.uuid = Uuid();
  PlugInRecord invalid = record("invalid");
  invalid.dataContainer.reset();  // a service plug-in needs one
  for (const PlugInRecord& bad : {noUuid, invalid}) {
    EXPECT_EQ(db_.plugInForProxy(bad), nullptr) << bad.identifier;
    EXPECT_EQ(db_.cacheCount(), 1u) << bad.identifier;
  }
}

TEST_F(DatabaseTest, LocaleChangeAndUninstallDropEntries) {
  const PlugInRecord a = put(record("a"));
  const PlugInRecord b = put(record("b"));
  db_.plugInForProxy(a);
  auto oldB = db_.plugInForProxy(b);
  ASSERT_EQ(db_.cacheCount(), 2u);

  ASSERT_TRUE(fakes_.registry->unregisterPlugIn(a.path).ok());
  EXPECT_TRUE(eventually([&] { return db_.cacheCount() == 1; }));
  EXPECT_EQ(db_.findPlugIn(b.uuid), oldB);
  EXPECT_EQ(db_.findPlugIn(a.uuid), nullptr);

  fakes_.locale->setLocale("de_CH");
  EXPECT_TRUE(eventually([&] { return db_.cacheCount() == 0; }));
  auto newB = db_.plugInForProxy(b);
  ASSERT_NE(newB, nullptr);
  EXPECT_NE(newB, oldB);
}

TEST_F(DatabaseTest, AutoElectionOnCreation) {
  // {stored election (none: no annotation), election after creation}
  const std::vector<std::pair<Value, Value>> cases = {{Value(), 1}, {-1, -1}, {3, 3}};
  for (std::size_t i = 0; i < cases.size(); ++i) {
    const std::string name = "auto" + std::to_string(i);
    if (!cases[i].first.isNone()) annotate("com.example." + name, cases[i].first);
    ASSERT_NE(db_.plugInForProxy(put(record(name, {{K(QVAutoElectEntitlement), true}}))), nullptr);
    auto annotation = db_.annotationStore().annotationForIdentifier("com.example." + name);
    EXPECT_EQ(annotation ? annotation->get(QVAnnotationElectionKey) : Value(), cases[i].second) << i;
  }
  // The user's 0 lasts only until the record is built again: after a purge
  // it is raised to 1 once more.
  const PlugInRecord again = put(record("again", {{K(QVAutoElectEntitlement), true}}));
  ASSERT_NE(db_.plugInForProxy(again), nullptr);
  annotate("com.example.again", 0);
  EXPECT_NE(db_.plugInForProxy(again), nullptr) << "a cache hit elects nothing";
  EXPECT_EQ(db_.annotationStore().annotationForIdentifier("com.example.again")->get(
                QVAnnotationElectionKey),
            Value(0));
  fakes_.locale->setLocale("fr");
  EXPECT_TRUE(eventually([&] { return db_.cacheCount() == 0; }));
  ASSERT_NE(db_.plugInForProxy(again), nullptr);
  EXPECT_EQ(db_.annotationStore().annotationForIdentifier("com.example.again")->get(
                QVAnnotationElectionKey),
            Value(1));
}

TEST_F(DatabaseTest, ElectionFilterReadsAnnotations) {
  put(record("plain"));
  put(record("elected"));
  put(record("never"));
  put(record("auto", Dictionary{{K(QVAutoElectEntitlement), true}}));
  put(record("autofalse", Dictionary{{K(QVAutoElectEntitlement), false}}));
  put(record("replacer", Dictionary{{K(QVOverrideEntitlement), "com.example.elected"}}));
  put(record("badreplacer", Dictionary{{K(QVOverrideEntitlement), 7}}));
  annotate("com.example.elected", 1);
  annotate("com.example.never", -1);
  annotate("com.example.badreplacer", 1);

  const std::vector<std::string> all = {"com.example.auto",        "com.example.autofalse",
                                        "com.example.badreplacer", "com.example.elected",
                                        "com.example.never",       "com.example.plain",
                                        "com.example.replacer"};
  const std::vector<std::string> one = {"com.example.auto", "com.example.badreplacer",
                                        "com.example.elected", "com.example.replacer"};
  struct Case {
    std::optional<Dictionary> query;
    std::vector<std::string> expected;
  };
  auto election = [](Value v) { return Dictionary{{K(QVUserElectionAttribute), std::move(v)}}; };
  const std::vector<Case> cases = {
      {std::nullopt, all},
      {election("1"), one},
      {election("01"), {}},
      {election(Array{"1", "-1"}), all},
      {election(Array{"=255", "0"}),
       {"com.example.autofalse", "com.example.never", "com.example.plain"}},
      {Dictionary{{"XOExtensionProtocol", "p"}}, all},
  };
  for (const Case& c : cases) {
    EXPECT_EQ(found(c.query), c.expected)
        << (c.query ? Value(*c.query).description() : std::string("no query"));
  }

  fakes_.registry->failQueries(platform::Error("test", 1, "down"));
  EXPECT_EQ(found(election("1")), std::vector<std::string>{"none"});
}

TEST_F(DatabaseTest, LookupsByUuidPathAndApplication) {
  const std::string app = platform::rootPath("Applications/Clock.app");
  const std::string empty = platform::rootPath("Applications/Empty.app");
  for (const std::string& path : {app, empty}) {
    ApplicationRecord record;
    record.path = path;
    record.executablePath = path + "/X";
    fakes_.registry->putApplication(record);
  }
  auto inApp = [&](const std::string& name) {
    PlugInRecord r = record(name);
    r.path = app + "/PlugIns/" + name + ".ovx";
    r.containingApplicationPath = app;
    return put(r);
  };
  const PlugInRecord first = inApp("first");
  const PlugInRecord second = inApp("second");

  auto atPath = db_.findPlugInAtPath(QVFileURLFromPath(first.path));
  ASSERT_NE(atPath, nullptr);
  EXPECT_EQ(db_.findPlugIn(first.uuid), atPath);
  EXPECT_EQ(db_.findPlugInAtPath(first.path), nullptr);  // a path, not a file URL

  auto within = db_.plugInsWithinApplication(QVFileURLFromPath(app));
  ASSERT_TRUE(within.has_value());
  ASSERT_EQ(within->size(), 2u);
  EXPECT_EQ((*within)[0], atPath);
  EXPECT_EQ((*within)[1]->uuid(), second.uuid);
  EXPECT_FALSE(db_.plugInsWithinApplication(QVFileURLFromPath(empty)).has_value());
}

}  // namespace
}  // namespace qvd::testing
