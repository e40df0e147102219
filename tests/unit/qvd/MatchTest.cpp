// The "match" request against an in-process server over a fake registry:
// the version table for every flag combination, the system-volume and
// preference rules, the per-plug-in gates with and without QVDiscoverAll,
// host-relative duplicates, dedicated plug-ins and replacement marks.
#include <gtest/gtest.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/log/LogCaptureForTesting.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using platform::holvane::PlugInRecord;
using platform::holvane::Volume;

std::string K(std::string_view key) { return std::string(key); }

// What one plug-in of a test looks like.
struct Spec {
  std::string name{};  // also the bundle name; identifier com.example.<id or name>
  std::string id{};
  std::string version = "1.0";
  Volume volume = Volume::System;
  std::optional<std::string> app{};   // containing application path
  std::optional<std::string> path{};  // bundle path, else under System/Library/PlugIns
  double registered = 1000;
  Dictionary extension{};  // extra XOExtension entries
  Dictionary entitlements{};
};

class MatchTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_NE(server_.server(), nullptr); }

  PlugInRecord put(const Spec& s) {
    if (s.app) {
      platform::holvane::ApplicationRecord application;
      application.path = *s.app;
      application.executablePath = *s.app + "/App";
      server_.fakes().registry->putApplication(application);
    }
    PlugInRecord r;
    r.uuid = Uuid::generate();
    r.path = s.path ? *s.path : platform::rootPath("System/Library/PlugIns/" + s.name + ".ovx");
    r.identifier = "com.example." + (s.id.empty() ? s.name : s.id);
    r.originalIdentifier = r.identifier;
    r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
    r.entitlements = s.entitlements;
    r.volume = s.volume;
    r.extensionPointName = "com.example.point";
    r.registered = platform::Date{s.registered};
    r.containingApplicationPath = s.app;
    Dictionary extension{{"XOExtensionProtocol", "p"},
                         {"XOExtensionPointIdentifier", "com.example.point"},
                         {"XOExtensionAttributes",
                          Dictionary{{"XOExtensionVersion", s.version},
                                     {"XOExtensionPointName", "com.example.point"},
                                     {"Name", s.name}}}};
    for (const auto& [key, value] : s.extension) extension.set(key, value);
    r.info = Dictionary{{"XOExtension", extension}};
    server_.fakes().registry->put(r);
    return r;
  }

  Value call(std::uint64_t flags, std::optional<Value> rules = std::nullopt) {
    Dictionary message = request(QVDMatchRequest);
    if (flags != 0) message.set(QVDFlagsKey, flags);
    if (rules) message.set(QVDRulesKey, *rules);
    TestClient client(server_);
    auto reply = client.call(message);
    EXPECT_TRUE(reply.ok());
    return reply.ok() ? *reply : Value();
  }
  // The "Name" attribute of each returned form, in reply order.
  std::vector<std::string> names(std::uint64_t flags, std::optional<Value> rules = std::nullopt) {
    Value reply = call(flags, std::move(rules));
    std::vector<std::string> out;
    const Dictionary* body = reply.dictionary();
    const Array* forms = body ? body->get(QVDMatchesKey).array() : nullptr;
    if (forms == nullptr) return {"error " + errorOf(reply).message};
    for (const Value& form : *forms) {
      const Value& name = form.dictionary()->get("info").dictionary()->get(
          "XOExtensionAttributes").dictionary()->get("Name");
      out.push_back(name.string() ? *name.string() : "?");
    }
    return out;
  }
  std::vector<std::string> sorted(std::vector<std::string> v) {
    std::sort(v.begin(), v.end());
    return v;
  }
  void grantManager(Dictionary more = {}) {
    Dictionary entitlements{{K(QVManagerEntitlement), true}};
    for (const auto& [k, v] : more) entitlements.set(k, v);
    server_.fakes().entitlements->setExecutableEntitlements(selfExecutable(), entitlements);
  }

  TestServer server_;
  const std::string app_ = platform::rootPath("Applications/Other.app");
};

TEST_F(MatchTest, VersionTableForEveryFlagCombination) {
  put({.name = "a10", .id = "a", .version = "1.0"});
  put({.name = "a12", .id = "a", .version = "1.2"});
  // Same version, one on the system volume: the system one is preferred
  // even though the other was modified later.
  put({.name = "sys", .id = "s", .version = "2.0", .registered = 10});
  put({.name = "app", .id = "s", .version = "2.0", .volume = Volume::Other, .app = app_,
       .path = app_ + "/PlugIns/s.ovx", .registered = 99});
  // Same version, both off the system volume: the later one wins.
  put({.name = "old", .id = "t", .version = "3", .volume = Volume::Other, .app = app_,
       .path = app_ + "/PlugIns/t1.ovx", .registered = 10});
  put({.name = "new", .id = "t", .version = "3", .volume = Volume::Other, .app = app_,
       .path = app_ + "/PlugIns/t2.ovx", .registered = 20});
  // "9" is older than "10" with digit runs compared by value.
  put({.name = "v9", .id = "u", .version = "1.9"});
  put({.name = "v10", .id = "u", .version = "1.10"});

  const std::vector<std::string> newestOnly = {"a12", "new", "sys", "v10"};
  const std::vector<std::string> versions = {"a10", "a12", "new", "sys", "v10", "v9"};
  const std::vector<std::string> everything = {"a10", "a12", "app", "new", "old", "sys", "v10", "v9"};
  {
    platform::log::LoggerRegistry::shared().applyFilterForTesting("info");
    platform::log::LogCaptureForTesting capture;
    EXPECT_EQ(sorted(names(0)), newestOnly);
    platform::log::LoggerRegistry::shared().reloadEnvironmentForTesting();
    // The log names the plug-ins the reply holds, and how many.
    const auto lines = capture.messages();
    EXPECT_EQ(std::count_if(lines.begin(), lines.end(),
                            [](const std::string& line) {
                              return line.rfind("Resulting plugin count: 4, UUIDs: (", 0) == 0;
                            }),
              1);
  }
  EXPECT_EQ(sorted(names(QVDiscoverKeepDuplicates)), newestOnly) << "0x4 alone does nothing";
  EXPECT_EQ(sorted(names(QVDiscoverKeepVersions)), versions);
  EXPECT_EQ(sorted(names(QVDiscoverKeepVersions | QVDiscoverKeepDuplicates)), everything);
  // The same state gives the same reply, in the same order, every time.
  const std::vector<std::string> first = names(QVDiscoverKeepVersions | QVDiscoverKeepDuplicates);
  for (int i = 0; i < 5; ++i) {
    EXPECT_EQ(names(QVDiscoverKeepVersions | QVDiscoverKeepDuplicates), first);
  }
}

TEST_F(MatchTest, SystemVolumeAndPerPlugInGates) {
  put({.name = "system"});
  put({.name = "inapp", .volume = Volume::Other, .app = app_, .path = app_ + "/PlugIns/i.ovx"});
  // Off the system volume without an application: only privileged
  // discovery sees it.
  put({.name = "stray", .volume = Volume::Other});
  const PlugInRecord held = put({.name = "held"});
  // Dedicated: only for the host whose own plug-ins directory holds it. This
  // host is a program outside any bundle, so it has no plug-ins directory,
  // even for a plug-in that names its directory as containing application.
  const std::string selfDir = std::filesystem::path(selfExecutable()).parent_path().string();
  put({.name = "mine", .volume = Volume::Other, .app = selfDir,
       .path = selfDir + "/PlugIns/mine.ovx", .extension = {{K(QVDedicatedKey), true}}});
  put({.name = "theirs", .volume = Volume::Other, .app = app_, .path = app_ + "/PlugIns/t.ovx",
       .extension = {{K(QVDedicatedKey), true}}});
  put({.name = "demanding", .extension = {{K(QVHostEntitlementInfoKey), "com.example.flag"}}});

  auto plugIn = server_.server()->findPlugIn(held.uuid);
  ASSERT_NE(plugIn, nullptr);
  server_.server()->addHold(std::make_shared<QVDPlugInHold>(
      Uuid::generate(), std::vector<std::shared_ptr<const QVDPlugIn>>{plugIn},
      std::weak_ptr<QVDMbxClient>()));

  EXPECT_EQ(sorted(names(0)), (std::vector<std::string>{"inapp", "system"}));
  EXPECT_EQ(sorted(names(QVDiscoverSystemOnly)), (std::vector<std::string>{"system"}));

  grantManager();
  const std::vector<std::string> all = {"demanding", "held", "inapp", "mine",
                                        "stray",     "system", "theirs"};
  EXPECT_EQ(sorted(names(QVDiscoverAll)), all) << "every per-plug-in gate is skipped";
  EXPECT_EQ(sorted(names(QVDiscoverAll | QVDiscoverSystemOnly)), all);

  // The host's restriction entitlement and the plug-in's demand apply
  // without QVDiscoverAll only.
  grantManager({{K(QVAllowedPlugInsEntitlement),
                 Dictionary{{"XOExtensionIdentifier", Array{"com.example.system", "com.example.demanding"}}}},
                {"com.example.flag", true}});
  EXPECT_EQ(sorted(names(0)), (std::vector<std::string>{"demanding", "system"}));
  EXPECT_EQ(sorted(names(QVDiscoverAll)), all);
}

TEST_F(MatchTest, ExclusionsApplyEvenToPrivilegedDiscoveryAndChangeAtOnce) {
  put({.name = "kept"});
  put({.name = "banned"});
  grantManager();
  server_.fakes().preferences->setValue(
      QVPreferenceDomain, QVExclusionsPreferenceKey,
      Array{Dictionary{{"XOExtensionIdentifier", "com.example.banned"}}, "not a rule set"});
  EXPECT_EQ(names(0), (std::vector<std::string>{"kept"}));
  EXPECT_EQ(names(QVDiscoverAll), (std::vector<std::string>{"kept"}));
  server_.fakes().preferences->setValue(QVPreferenceDomain, QVExclusionsPreferenceKey, Value());
  EXPECT_EQ(names(0), (std::vector<std::string>{"banned", "kept"}));
}

TEST_F(MatchTest, RulesFlagsAndVersions) {
  put({.name = "one", .version = "2.9"});
  put({.name = "two", .version = "2.10"});
  EXPECT_EQ(names(0, Value(Dictionary{{"XOExtensionVersion", ">=2.10"}})),
            (std::vector<std::string>{"two"}));
  EXPECT_EQ(names(0, Value(Dictionary{{"XOExtensionPointName", "com.example.point"}})),
            (std::vector<std::string>{"one", "two"}));
  EXPECT_EQ(names(0, Value(Dictionary{{"XOExtensionPointName", "elsewhere"}})),
            std::vector<std::string>{});
  EXPECT_EQ(names(0, Value(Array{"x"})),
            (std::vector<std::string>{"error invalid request format (bad rules dictionary)"}));

  // Privileged discovery needs the manager entitlement and no sandbox.
  EXPECT_EQ(errorOf(call(QVDiscoverAll)),
            (ErrorReply{11, "unauthorized discovery flag (QVDiscoverAll)"}));
  grantManager();
  server_.fakes().sandbox->setDefault(platform::sandbox::Sandboxing::Sandboxed);
  EXPECT_EQ(errorOf(call(QVDiscoverAll)),
            (ErrorReply{11, "unauthorized discovery flag (QVDiscoverAll)"}));
  server_.fakes().sandbox->setDefault(platform::sandbox::Sandboxing::NotSandboxed);
  EXPECT_EQ(errorOf(call(QVDiscoverAll)), ErrorReply{});

  // Version 2 runs the request but has no encoding for the forms.
  Dictionary old = request(QVDMatchRequest);
  old.set(QVDVersionKey, 2);
  TestClient client(server_);
  auto reply = client.call(old);
  ASSERT_TRUE(reply.ok());
  EXPECT_EQ(errorOf(*reply), ErrorReply{});
  EXPECT_TRUE(reply->dictionary()->get(QVDMatchesKey).isNone());
}

TEST_F(MatchTest, ACopyInsideTheHostWinsOverNewerCopiesElsewhere) {
  const std::string selfDir = std::filesystem::path(selfExecutable()).parent_path().string();
  put({.name = "inside", .id = "x", .version = "1.0", .volume = Volume::Other, .app = selfDir,
       .path = selfDir + "/PlugIns/x.ovx"});
  put({.name = "elsewhere", .id = "x", .version = "9.0", .volume = Volume::Other, .app = app_,
       .path = app_ + "/PlugIns/x.ovx"});
  put({.name = "system", .id = "x", .version = "9.0"});
  // Another version inside the host itself stays a candidate.
  put({.name = "inside2", .id = "x", .version = "2.0", .volume = Volume::Other, .app = selfDir,
       .path = selfDir + "/PlugIns/x2.ovx"});
  put({.name = "unrelated", .id = "y"});
  std::vector<std::string> found = sorted(names(QVDiscoverKeepVersions));
  EXPECT_EQ(found, (std::vector<std::string>{"inside", "inside2", "unrelated"}));
}

TEST_F(MatchTest, ReplacementMarksLinkBothForms) {
  put({.name = "a"});
  put({.name = "b", .entitlements = {{K(QVOverrideEntitlement), "com.example.a"}}});
  put({.name = "c", .entitlements = {{K(QVOverrideEntitlement), Array{"com.example.none", 5}}}});
  Value reply = call(0);
  const Array* forms = reply.dictionary()->get(QVDMatchesKey).array();
  ASSERT_NE(forms, nullptr);
  ASSERT_EQ(forms->size(), 3u);
  std::map<std::string, Dictionary> byId;
  for (const Value& form : *forms) {
    byId[*form.dictionary()->get(QVFormIdentifierKey).string()] = *form.dictionary();
  }
  EXPECT_EQ(byId["com.example.a"].get(QVOverriderFormKey), byId["com.example.b"].get(QVFormUUIDKey));
  EXPECT_EQ(byId["com.example.b"].get(QVOverridingFormKey), Value("com.example.a"));
  EXPECT_TRUE(byId["com.example.c"].get(QVOverridingFormKey).isNone());
  EXPECT_TRUE(byId["com.example.b"].get(QVOverriderFormKey).isNone());
  // Each form carries its annotations, empty when there are none.
  EXPECT_EQ(byId["com.example.a"].get(QVAnnotationsFormKey), Value(Dictionary()));
}

}  // namespace
}  // namespace qvd::testing
