// "ready" and "access" against an in-process server over fakes, and the
// installation requests: what the service manager is handed (environment
// order, sandbox profile, overlay), that every check runs before anything
// is enabled, and the installation requests' own refusals.
#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "platform/root/Root.h"
#include "platform/vmap/AtomicFile.h"
#include "tests/unit/qvd/QvdTestSupport.h"

namespace qvd::testing {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using platform::holvane::PlugInRecord;

struct Bundle {
  std::string name;
  std::string point = "com.example.point";
  Dictionary extension{};  // extra XOExtension entries
  Dictionary service{};    // MBXService, when not empty
  bool withContainer = true;
  std::optional<std::string> app{};  // containing application path
};

class ActivationTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_NE(server_.server(), nullptr); }

  // A plug-in on disk (the executable is looked up there) and in the
  // fake registry.
  PlugInRecord put(const Bundle& b) {
    const std::string base =
        b.app ? *b.app + "/PlugIns/" : platform::rootPath("System/Library/PlugIns/");
    const std::string path = base + b.name + "-" + Uuid::generate().toString() + ".ovx";
    std::filesystem::create_directories(path);
    Dictionary extension{{"XOExtensionPointIdentifier", b.point},
                         {"XOExtensionAttributes", Dictionary{{"XOExtensionPointName", b.point}}}};
    for (const auto& [key, value] : b.extension) extension.set(key, value);
    Dictionary info{{"BXBundleIdentifier", "com.example." + b.name},
                    {"BXExecutable", "Run"},
                    {"XOExtension", extension}};
    if (!b.service.empty()) info.set("MBXService", b.service);
    EXPECT_TRUE(platform::vmap::writeFileAtomically(path + "/Info.vmap", Value(info),
                                                    platform::vmap::Format::Xml,
                                                    platform::vmap::FileOps::real())
                    .ok());
    std::ofstream(path + "/Run") << "#!/bin/sh\n";
    PlugInRecord r;
    r.uuid = Uuid::generate();
    r.path = path;
    r.identifier = "com.example." + b.name;
    r.originalIdentifier = r.identifier;
    r.bundleIdentifier = r.identifier;
    if (b.withContainer)
      r.dataContainer = platform::rootPath("var/containers/Data/" + r.identifier);
    r.volume = b.app ? platform::holvane::Volume::Other : platform::holvane::Volume::System;
    r.extensionPointName = b.point;
    r.containingApplicationPath = b.app;
    r.info = info;
    server_.fakes().registry->put(r);
    return r;
  }

  Value ready(const std::vector<PlugInRecord>& plugIns,
              std::optional<Dictionary> environment = {}) {
    Dictionary message = request(QVDReadyRequest);
    Array uuids;
    for (const PlugInRecord& r : plugIns) uuids.append(r.uuid);
    message.set(QVDUUIDKey, uuids);
    if (environment) message.set(QVDEnvironmentKey, *environment);
    auto reply = TestClient(server_).call(message);
    EXPECT_TRUE(reply.ok());
    return reply.ok() ? *reply : Value();
  }

  void grant(Dictionary entitlements) {
    server_.fakes().entitlements->setExecutableEntitlements(selfExecutable(), entitlements);
  }
  std::vector<platform::lumend::FakeServiceManager::Addition> additions() {
    return server_.fakes().serviceManager->additions();
  }
  // The service dictionary of the last addition.
  Dictionary lastService() {
    const auto all = additions();
    if (all.empty()) return {};
    const Dictionary* service = all.back().overlay.get("MBXService").dictionary();
    return service ? *service : Dictionary();
  }

  TestServer server_;
};

TEST_F(ActivationTest, TheOverlayMergesTheEnvironmentWithThePlugInsOwnVariablesLast) {
  grant({{std::string(QVEnvironmentProvisionEntitlement), true}});
  const PlugInRecord r = put(
      {.name = "env",
       .service = {{"EnvironmentVariables", Dictionary{{"TMPDIR", "/own"}}}, {"Label", "kept"}}});
  const Dictionary host{{"HOME", "/host"}, {"TMPDIR", "/host/tmp"}, {"LANG", "de"}};
  EXPECT_EQ(errorOf(ready({r}, host)), ErrorReply{});

  const auto all = additions();
  ASSERT_EQ(all.size(), 1u);
  const auto& added = all[0];
  EXPECT_EQ(added.hostPid, ::getpid());
  EXPECT_EQ(added.executablePath, r.path + "/Run");
  EXPECT_EQ(added.overlay.get("BXBundlePackageType"), Value("MBX!"));
  EXPECT_EQ(added.overlay.size(), 2u);
  const Dictionary service = lastService();
  EXPECT_EQ(service.get("Label"), Value("kept"));
  EXPECT_EQ(service.get("_OmitSandboxParameters"), Value(true));
  EXPECT_EQ(service.get("_SandboxProfile"), Value("plugin"));
  EXPECT_EQ(Value(*service.get("EnvironmentVariables").dictionary()),
            Value(Dictionary{{"HOME", *r.dataContainer},
                             {"TMPDIR", "/own"},
                             {"LANG", "de"},
                             {"BXFIXED_USER_HOME", *r.dataContainer}}));
}

TEST_F(ActivationTest, TheSandboxProfileFollowsTheExtensionPointAndTheKeyboardConsent) {
  const std::string app = platform::rootPath("Applications/Keys.app");
  std::filesystem::create_directories(app);
  ASSERT_TRUE(platform::vmap::writeFileAtomically(
                  app + "/Info.vmap", Value(Dictionary{{"BXBundleIdentifier", "com.example.keys"}}),
                  platform::vmap::Format::Xml, platform::vmap::FileOps::real())
                  .ok());
  const Dictionary openAccess{{"XOExtensionAttributes", Dictionary{{"RequestsOpenAccess", true}}}};
  const struct {
    Bundle bundle;
    const char* profile;
  } cases[] = {
      {{.name = "k1", .point = "com.corvane.keyboard-service"}, "keyboard"},
      {{.name = "k2", .point = "com.corvane.keyboard-service", .extension = openAccess, .app = app},
       "keyboard"},
      {{.name = "thumb", .point = "com.corvane.glimpsa.thumbnail.highmemory"}, "glimpsa-thumbnail"},
      {{.name = "filter", .point = "com.corvane.netwarden.filter-data"}, "network-filter"},
      {{.name = "other", .point = "com.example.unknown"}, "plugin"},
  };
  for (const auto& c : cases) {
    SCOPED_TRACE(c.bundle.name);
    EXPECT_EQ(errorOf(ready({put(c.bundle)})), ErrorReply{});
    EXPECT_EQ(lastService().get("_SandboxProfile"), Value(c.profile));
  }
  // Once the user consents for the application, an open-access keyboard
  // runs in the ordinary profile.
  server_.fakes().consents->setRecords(
      "com.example.keys",
      {{.service = std::string(platform::pvg::kPVGServiceKeyboardNetwork), .granted = true}});
  EXPECT_EQ(errorOf(ready({put({.name = "k3",
                                .point = "com.corvane.keyboard-service",
                                .extension = openAccess,
                                .app = app})})),
            ErrorReply{});
  EXPECT_EQ(lastService().get("_SandboxProfile"), Value("plugin"));
}

TEST_F(ActivationTest, ARefusalForOnePlugInEnablesNone) {
  const PlugInRecord first = put({.name = "first"});
  // An environment without the entitlement is refused before any look-up.
  const std::size_t lookups = server_.fakes().registry->lookupCount();
  EXPECT_EQ(errorOf(ready({first}, Dictionary{})),
            (ErrorReply{11,
                        "Transmission of environment variables requires the "
                        "com.corvane.developer.quorvex.provide-environment host entitlement"}));
  EXPECT_EQ(server_.fakes().registry->lookupCount(), lookups);

  const PlugInRecord demanding =
      put({.name = "demanding",
           .extension = {{std::string(QVHostEntitlementInfoKey), "com.example.flag"}}});
  const ErrorReply refused = errorOf(ready({first, demanding}));
  EXPECT_EQ(refused.code, 11u);
  EXPECT_EQ(refused.message.rfind("access to plugin com.example.demanding denied: ", 0), 0u)
      << refused.message;

  const PlugInRecord held = put({.name = "held"});
  server_.server()->addHold(std::make_shared<QVDPlugInHold>(
      Uuid::generate(),
      std::vector<std::shared_ptr<const QVDPlugIn>>{server_.server()->findPlugIn(held.uuid)},
      std::weak_ptr<QVDMbxClient>()));
  EXPECT_EQ(errorOf(ready({first, held})),
            (ErrorReply{11, "access to plugin com.example.held denied: the plug-in is on hold"}));
  EXPECT_TRUE(additions().empty());

  // A data plug-in is skipped, and one listed twice is enabled once.
  const PlugInRecord data =
      put({.name = "data",
           .extension = {{"XOExtensionProtocol", std::string(QVDataProtocol)}},
           .withContainer = false});
  EXPECT_EQ(errorOf(ready({data, first, first})), ErrorReply{});
  ASSERT_EQ(additions().size(), 1u);
  EXPECT_EQ(additions()[0].executablePath, first.path + "/Run");
}

TEST_F(ActivationTest, ARefusingServiceManagerIsReportedWithThePlugIn) {
  // (That a failure spares the next plug-in is shown against the real
  // daemon.)
  const PlugInRecord fine = put({.name = "fine"});
  server_.fakes().serviceManager->setAdditionResult(ESRCH);
  EXPECT_EQ(errorOf(ready({fine})), (ErrorReply{4, "unable to enable plug-in com.example.fine(" +
                                                       fine.uuid.toString() + ")"}));
}

TEST_F(ActivationTest, AccessHandsOutTokensInOrderAndStopsAtTheFirstFailure) {
  const PlugInRecord a = put({.name = "a"});
  const PlugInRecord b = put({.name = "b"});
  Dictionary message = request(QVDAccessRequest);
  message.set(QVDUUIDKey, Array{b.uuid, a.uuid});
  auto reply = TestClient(server_).call(message);
  ASSERT_TRUE(reply.ok());
  EXPECT_EQ(reply->dictionary()->get(QVDExtensionsKey),
            Value(Array{"fake;file;" + b.path, "fake;file;" + a.path}));
  EXPECT_TRUE(additions().empty());

  server_.fakes().extensions->failPath(a.path, EACCES);
  reply = TestClient(server_).call(message);
  EXPECT_EQ(errorOf(*reply), (ErrorReply{4, "cannot create file extension to " + a.path + ": " +
                                                std::to_string(EACCES)}));
  EXPECT_TRUE(reply->dictionary()->get(QVDExtensionsKey).isNone());
}

TEST_F(ActivationTest, RemovingAnUnknownPathNamesItAndBulkTakesAnyFlags) {
  // (The entitlement per path, and adding, are shown against the real
  // daemon.)
  grant({{std::string(QVManagerEntitlement), true}});
  const std::string nowhere = platform::rootPath("nowhere/x.ovx");
  Dictionary remove = request(QVDRemoveRequest);
  remove.set(QVDPathsKey, Array{nowhere});
  EXPECT_EQ(errorOf(*TestClient(server_).call(remove)), (ErrorReply{9, "no plugin at " + nowhere}));

  Dictionary bulk = request(QVDBulkRequest);
  bulk.set(QVDFlagsKey, std::uint64_t{0x1234});
  EXPECT_EQ(errorOf(*TestClient(server_).call(bulk)), ErrorReply{});
}

}  // namespace
}  // namespace qvd::testing
