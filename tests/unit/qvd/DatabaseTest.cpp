// The plug-in database over a fake registration service: the cache's purge
// and drop rules, the election filter of the filtered query, and the
// look-ups by UUID, location and application.
#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
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

// Constant names as dictionary keys.
std::string K(std::string_view key) {
  return std::string(key);
}

ApplicationRecord application(std::string path, std::optional<std::string> executable) {
  ApplicationRecord a;
  a.path = std::move(path);
  a.executablePath = std::move(executable);
  return a;
}

class TestDatabase final : public QVDatabase {
 public:
  using QVDatabase::initDatabase;
};

// Names the annotation of a plug-in identifier, without a plug-in object.
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

  // A record that passes validation: on the system volume, with a data
  // container. `entitlements` are the plug-in's own.
  PlugInRecord record(const std::string& name, Dictionary entitlements = {},
                      std::optional<std::string> point = std::nullopt) {
    PlugInRecord r;
    r.uuid = Uuid::generate();
    r.path = platform::rootPath("System/Library/PlugIns/" + name + ".ovx");
    r.identifier = "com.example." + name;
    r.originalIdentifier = r.identifier;
    r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
    r.entitlements = std::move(entitlements);
    r.extensionPointName = point;
    r.info = Dictionary{{"XOExtension", Dictionary{{"XOExtensionProtocol", "p"},
                                                   {"XOExtensionAttributes", Dictionary{}}}}};
    return r;
  }
  PlugInRecord put(PlugInRecord r) {
    fakes_.registry->put(r);
    return r;
  }
  void annotate(const std::string& identifier, Value election) {
    db_.annotationStore().setAnnotationForPlugIn(
        Dictionary{{std::string(QVAnnotationElectionKey), std::move(election)}},
        AnnotationKey(identifier));
  }
  // The identifiers findPlugIns() answers for `query`, sorted; "none" for no set.
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
  struct Case {
    std::uint64_t limit;
    int creations;
    std::size_t cached;  // entries afterwards
  };
  // The purge runs before the insertion, so a cache may hold limit + 1.
  const std::vector<Case> cases = {
      {0, 1, 1}, {0, 3, 1}, {2, 2, 2}, {2, 3, 3}, {2, 4, 1}, {2, 5, 2},
  };
  for (const Case& c : cases) {
    db_.syncQueue()->sync([&] { db_.purgeCachesToLimit(0); });
    db_.setCacheLimit(c.limit);
    for (int i = 0; i < c.creations; ++i) {
      ASSERT_NE(db_.plugInForProxy(put(record("limit" + std::to_string(i)))), nullptr);
    }
    EXPECT_EQ(db_.cacheCount(), c.cached) << "limit " << c.limit << ", " << c.creations;
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
  auto oldA = db_.plugInForProxy(a);
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
  struct Case {
    const char* name;
    Value stored;  // none: no annotation
    Value after;
  };
  const std::vector<Case> cases = {
      {"unannotated", Value(), Value(1)},
      {"zero", Value(0), Value(1)},
      {"never", Value(-1), Value(-1)},
      {"elected", Value(3), Value(3)},
  };
  for (const Case& c : cases) {
    const std::string identifier = std::string("com.example.auto") + c.name;
    if (!c.stored.isNone()) annotate(identifier, c.stored);
    PlugInRecord r =
        record(std::string("auto") + c.name, Dictionary{{K(QVAutoElectEntitlement), true}});
    ASSERT_NE(db_.plugInForProxy(put(r)), nullptr) << c.name;
    auto annotation = db_.annotationStore().annotationForIdentifier(identifier);
    EXPECT_EQ(annotation ? annotation->get(QVAnnotationElectionKey) : Value(), c.after) << c.name;
  }
}

TEST(ElectionNormalisation, ElementsListsAndKeys) {
  struct Element {
    Value element;
    std::optional<std::string> normalized;
  };
  const std::vector<Element> elements = {
      {"=1", "1"},
      {"1", "1"},
      {"01", "01"},
      {"=", ""},
      {"=-1", "-1"},
      {"-1", {}},
      {"", {}},
      {" 1", {}},
      {Value(1), {}},
      {"\xC3\xA9t\xC3\xA9", "\xC3\xA9t\xC3\xA9"},
      {"\xCC\x81x", "\xCC\x81x"},
      {"\xE2\x80\xA2", {}},
      {"\xC3", {}},
  };
  for (const Element& e : elements) {
    EXPECT_EQ(normalizedElection(e.element), e.normalized) << e.element.description();
  }

  using List = std::optional<std::vector<std::string>>;
  struct Query {
    Value election;
    List list;
  };
  const std::vector<Query> queries = {
      {Value(), {}},
      {Value(1), {}},
      {"=1", List({"1"})},
      {"-1", {}},
      {Array{"1", "=0"}, List({"1", "0"})},
      {Array{"1", "-1"}, {}},
      {Array{"1", 2}, {}},
      {Array{}, List(std::vector<std::string>{})},
  };
  for (const Query& q : queries) {
    Dictionary query{{"XOExtensionPointName", "x"}};
    if (!q.election.isNone()) query.set(QVUserElectionAttribute, q.election);
    EXPECT_EQ(electionListFromQuery(query), q.list) << q.election.description();
  }

  const std::vector<std::pair<Value, std::string>> keys = {
      {Value(1), "1"},   {Value(-1), "255"}, {Value(256), "0"}, {Value(257u), "1"},
      {Value(1.9), "1"}, {Value(true), "1"}, {Value("3"), "0"}, {Value(-2.5), "254"},
  };
  for (const auto& [value, key] : keys) EXPECT_EQ(electionKey(value), key) << value.description();
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
      {Dictionary{}, all},
      {election("1"), one},
      {election("=1"), one},
      {election("01"), {}},
      {election(Array{"1", "-1"}), all},
      {election("0"), {"com.example.autofalse", "com.example.plain"}},
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
  fakes_.registry->clearFailure();
}

TEST_F(DatabaseTest, ExtensionPointRuleNarrowsTheFilteredRecords) {
  ::setenv("QV_LOG", "debug", 1);
  ::setenv("QV_LOG_PRIVATE", "1", 1);
  platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
  put(record("a1", {}, "com.a.point"));
  put(record("a2", {}, "com.a.point"));
  put(record("b", {}, "com.b.point"));
  put(record("c", {}, "com.c.point7"));

  struct Case {
    Value rule;
    std::size_t filtered;  // records the election filter saw
  };
  const std::vector<Case> cases = {
      {"com.a.point", 2},        {"=com.a.point", 2}, {">com.a", 4},
      {Array{"com.a.point"}, 4}, {"com.c.point7", 4}, {Value(), 4},
  };
  for (const Case& c : cases) {
    Dictionary query{{K(QVUserElectionAttribute), "0"}};
    if (!c.rule.isNone()) query.set("XOExtensionPointName", c.rule);
    platform::log::LogCaptureForTesting capture;
    (void)db_.findPlugIns(query);
    std::size_t filtered = 0;
    for (const std::string& message : capture.messages()) {
      if (message.starts_with("hv filter ")) ++filtered;
    }
    EXPECT_EQ(filtered, c.filtered) << c.rule.description();
  }
  ::unsetenv("QV_LOG");
  ::unsetenv("QV_LOG_PRIVATE");
  platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
}

TEST_F(DatabaseTest, LookupsByUuidPathAndApplication) {
  const std::string app = platform::rootPath("Applications/Clock.app");
  const std::string placeholder = platform::rootPath("Applications/Pending.app");
  const std::string empty = platform::rootPath("Applications/Empty.app");
  fakes_.registry->putApplication(application(app, app + "/Clock"));
  fakes_.registry->putApplication(application(placeholder, std::nullopt));
  fakes_.registry->putApplication(application(empty, empty + "/E"));
  auto inApp = [&](const std::string& application, const std::string& name) {
    PlugInRecord r = record(name);
    r.path = application + "/PlugIns/" + name + ".ovx";
    r.containingApplicationPath = application;
    return put(r);
  };
  const PlugInRecord first = inApp(app, "first");
  const PlugInRecord second = inApp(app, "second");
  inApp(placeholder, "pending");
  PlugInRecord twin = record("twin");
  put(twin);
  twin.path = platform::rootPath("System/Library/PlugIns/twin-copy.ovx");
  put(twin);  // the same UUID at a second location

  auto atPath = db_.findPlugInAtPath(QVFileURLFromPath(first.path));
  ASSERT_NE(atPath, nullptr);
  EXPECT_EQ(db_.findPlugIn(first.uuid), atPath);
  EXPECT_EQ(db_.findPlugIn(Uuid::generate()), nullptr);
  EXPECT_EQ(db_.findPlugInAtPath(QVFileURLFromPath(app + "/PlugIns/none.ovx")), nullptr);
  EXPECT_EQ(db_.findPlugInAtPath(first.path), nullptr);  // a path, not a file URL

  auto within = db_.plugInsWithinApplication(QVFileURLFromPath(app));
  ASSERT_TRUE(within.has_value());
  ASSERT_EQ(within->size(), 2u);
  EXPECT_EQ((*within)[0], atPath);
  EXPECT_EQ((*within)[1]->uuid(), second.uuid);
  EXPECT_FALSE(db_.plugInsWithinApplication(QVFileURLFromPath(empty)).has_value());
  EXPECT_FALSE(db_.plugInsWithinApplication(QVFileURLFromPath(app + "x")).has_value());
  // Placeholders are skipped by the query, not by the application look-up.
  EXPECT_TRUE(db_.plugInsWithinApplication(QVFileURLFromPath(placeholder)).has_value());

  EXPECT_EQ(
      found(std::nullopt),
      (std::vector<std::string>{"com.example.first", "com.example.second", "com.example.twin"}));
}

}  // namespace
}  // namespace qvd::testing
