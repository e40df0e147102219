// Installing and activating plug-ins against the real daemon: bundles added
// and removed by path, "ready"
// handing the service manager what a host may run and with which
// environment, and "access" tokens a host can consume. Entitled hosts are
// copies of qvctl in the root, each granted its own entitlements: the daemon
// knows a host by the executable behind its connection.
#include <gtest/gtest.h>
#include <signal.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <map>
#include <set>
#include <sstream>

#include "Quorvex/QVDConstants.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"
#include "tests/unit/holds/PlugInProcess.h"

// Records and UUIDs show as values when a comparison fails.
namespace platform {
inline void PrintTo(const Value& value, std::ostream* out) {
  *out << value.description();
}
inline void PrintTo(const Uuid& uuid, std::ostream* out) {
  *out << uuid.toString();
}
}  // namespace platform

namespace qvd::integration {
namespace {

namespace fs = std::filesystem;
using platform::Array;
using platform::Dictionary;
using platform::Uuid;
using platform::Value;
using Identifiers = std::multiset<std::string>;
using Records = std::multimap<std::string, Value>;

constexpr const char* kPoint = "com.example.installed";
constexpr const char* kManager = "com.corvane.private.quorvex.manager";
constexpr const char* kProvider = "com.corvane.developer.quorvex.provide-environment";

struct PlugIn {
  std::string path;
  std::string identifier;
  Uuid uuid;
};

// Whether qvctl failed with the daemon's error `code` and `message`.
bool refusedWith(const Finished& run, std::uint64_t code, const std::string& message) {
  return run.status == 1 && run.err.find("qvctl: error " + std::to_string(code) + ": " + message +
                                         "\n") != std::string::npos;
}

class InstallationActivationTest : public ::testing::Test {
 protected:
  void SetUp() override { ASSERT_TRUE(daemon_.waitUntilServing()) << daemon_.log(); }
  void TearDown() override { EXPECT_EQ(daemon_.terminate(), 0) << daemon_.log(); }

  // Removal signals every process of the system whose executable lies in a
  // bundle with the identifier: these are this test process's own.
  std::string identifier(const std::string& name) const {
    return "com.example." + name + std::to_string(::getpid());
  }
  std::string systemBundle(const std::string& name) const {
    return root_ / ("System/Library/PlugIns/" + name + ".ovx");
  }
  std::string container(const PlugIn& plugIn) const {
    return root_ / ("var/containers/Data/" + plugIn.identifier);
  }

  // A bundle at `bundle` with identifier(name) on kPoint; `info` adds to its
  // manifest, `extension` to its XOExtension. Its executable is a real
  // plug-in process program unless `withExecutable` is false.
  PlugIn writeBundle(const std::string& bundle, const std::string& name,
                     const Dictionary& info = {}, const Dictionary& extension = {},
                     bool withExecutable = true) {
    Dictionary point{{"XOExtensionPointIdentifier", kPoint}};
    for (const auto& [key, value] : extension) point.set(key, value);
    Dictionary manifest{{"BXBundleIdentifier", identifier(name)},
                        {"BXBundleShortVersionString", "1.0"},
                        {"BXExecutable", "Plug"},
                        {"XOExtension", point}};
    for (const auto& [key, value] : info) manifest.set(key, value);
    writeVmapFile(bundle + "/Info.vmap", manifest);
    if (withExecutable) holds_testing::installPlugInExecutable(bundle);
    return PlugIn{bundle, identifier(name), Uuid()};
  }
  // A system plug-in written into the running daemon's root and added.
  PlugIn install(const std::string& name, const Dictionary& info = {},
                 const Dictionary& extension = {}) {
    PlugIn plugIn = writeBundle(systemBundle(name), name, info, extension);
    const Finished added = runQvctl(root_, {"add", plugIn.path});
    EXPECT_EQ(added.status, 0) << added.err << daemon_.log();
    plugIn.uuid = uuidOf(plugIn.path);
    EXPECT_FALSE(plugIn.uuid.isNull()) << name;
    return plugIn;
  }
  // The UUID "qvctl find" shows for a path or UUID; null when not found.
  Uuid uuidOf(const std::string& pathOrUuid) {
    const Finished found = runQvctl(root_, {"--json", "find", pathOrUuid});
    const std::string key = "\"uuid\": \"";
    const std::size_t at = found.out.find(key);
    if (found.status != 0 || at == std::string::npos) return Uuid();
    return Uuid::parse(found.out.substr(at + key.size(), 36)).value_or(Uuid());
  }

  // A copy of qvctl at <root>/bin/<name> granted `entitlements`.
  std::string host(const std::string& name, const Dictionary& entitlements) {
    const std::string executable = root_ / ("bin/" + name);
    fs::create_directories(root_ / "bin");
    fs::copy_file(QVCTL_PATH, executable);
    const std::string grant = root_ / ("etc/quorvex/entitlements/" + name + ".vmap");
    writeVmapFile(grant, Dictionary{{"executable", executable}, {"entitlements", entitlements}});
    // A grant that others may write counts for nothing.
    fs::permissions(grant, fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read |
                               fs::perms::others_read);
    return executable;
  }

  // The service manager's records, by the bundle identifier they are filed
  // under (<host pid>/<identifier>.vmap), whatever the host.
  Records records() const {
    Records found;
    std::error_code ignored;
    for (const auto& host : fs::directory_iterator(root_ / "run/quorvex/lumend", ignored)) {
      for (const auto& file : fs::directory_iterator(host.path(), ignored)) {
        found.emplace(file.path().stem().string(), readVmapFile(file.path()));
      }
    }
    return found;
  }
  Identifiers recorded() const {
    Identifiers identifiers;
    for (const auto& [identifier, record] : records()) identifiers.insert(identifier);
    return identifiers;
  }
  // The record "ready" should leave for `plugIn` run from `executable`: its
  // container's variables with `environment` laid over them.
  Value expectedRecord(const PlugIn& plugIn, const std::string& executable,
                       const Dictionary& environment = {}) const {
    Dictionary variables{{"HOME", container(plugIn)},
                         {"BXFIXED_USER_HOME", container(plugIn)},
                         {"TMPDIR", container(plugIn) + "/tmp"}};
    for (const auto& [name, value] : environment) variables.set(name, value);
    const Dictionary service{{"EnvironmentVariables", variables},
                             {"_SandboxProfile", "plugin"},
                             {"_OmitSandboxParameters", true}};
    const Dictionary overlay{{"MBXService", service}, {"BXBundlePackageType", "MBX!"}};
    return Dictionary{{"executable", executable}, {"overlay", overlay}};
  }

  TemporaryRoot root_;
  Daemon daemon_{root_, {}};
};

TEST_F(InstallationActivationTest, AnAddedBundleIsServedAndAMissingOneRefused) {
  const PlugIn late = writeBundle(systemBundle("late"), "late");
  EXPECT_TRUE(uuidOf(late.path).isNull()) << "unknown before it is added";

  const Finished added = runQvctl(root_, {"add", late.path});
  ASSERT_EQ(added.status, 0) << added.err << daemon_.log();
  const Uuid uuid = uuidOf(late.path);
  ASSERT_FALSE(uuid.isNull()) << daemon_.log();
  EXPECT_EQ(uuidOf(uuid.toString()), uuid);
  const Finished matched =
      runQvctl(root_, {"match", std::string("XOExtensionPointName=") + kPoint});
  EXPECT_EQ(matched.status, 0) << matched.err;
  EXPECT_NE(matched.out.find(late.identifier), std::string::npos) << matched.out;
  EXPECT_TRUE(fs::is_directory(container(late) + "/tmp")) << "registration made its container";

  const std::string missing = systemBundle("missing");
  const Finished refused = runQvctl(root_, {"add", missing});
  EXPECT_TRUE(refusedWith(refused, 9, "invalid plugin path: " + missing)) << refused.err;

  // Removal, which ends its running processes, is shown by the end-to-end
  // suite.
}

TEST_F(InstallationActivationTest, RemoveNeedsTheManagerEntitlementForEachPath) {
  const PlugIn first = install("first");
  const PlugIn second = install("second");
  const Finished refused = runQvctl(root_, {"remove", first.path, second.path});
  EXPECT_TRUE(refusedWith(refused, 11, "caller lacks entitlement for this operation"))
      << refused.err;
  EXPECT_EQ(uuidOf(first.uuid.toString()), first.uuid) << "nothing was deregistered";
  EXPECT_EQ(uuidOf(second.uuid.toString()), second.uuid);

  // Another unentitled client: no path asks for nothing.
  auto removal = [&](Array paths) {
    Dictionary request{{std::string(QVDRequestKey), std::string(QVDRemoveRequest)},
                       {std::string(QVDVersionKey), 3}};
    request.set(QVDPathsKey, std::move(paths));
    return errorOf(sendRequest(root_, request).reply);
  };
  EXPECT_EQ(removal(Array{}), kSuccess);
  EXPECT_EQ(
      removal(Array{Value(first.path)}),
      (std::pair<std::uint64_t, std::string>{11, "caller lacks entitlement for this operation"}));
  EXPECT_EQ(uuidOf(first.uuid.toString()), first.uuid);
}

TEST_F(InstallationActivationTest, ReadyRecordsTheOverlayWithTheMergedEnvironment) {
  const PlugIn plain = install("plain");
  const Dictionary own{{"TMPDIR", "/own/tmp"}, {"OWN", "plug-in"}};
  const PlugIn declaring =
      install("declaring", Dictionary{{"MBXService", Dictionary{{"EnvironmentVariables", own}}}});

  // With no variables from the host or the plug-in, the container's.
  Finished ready = runQvctl(root_, {"ready", plain.uuid.toString()});
  EXPECT_EQ(ready.status, 0) << ready.err << daemon_.log();
  // The host's variables, then the container's, then the plug-in's own.
  ready = runProcess({host("provider", Dictionary{{kProvider, true}}), "ready", "--env",
                      "HOME=/host/home", "--env", "BXFIXED_USER_HOME=/host", "--env", "KEPT=host",
                      "--env", "OWN=host", declaring.uuid.toString()},
                     root_.path());
  EXPECT_EQ(ready.status, 0) << ready.err << daemon_.log();
  EXPECT_EQ(
      records(),
      (Records{{plain.identifier, expectedRecord(plain, plain.path + "/Plug")},
               {declaring.identifier,
                expectedRecord(declaring, declaring.path + "/Plug",
                               {{"TMPDIR", "/own/tmp"}, {"KEPT", "host"}, {"OWN", "plug-in"}})}}));
}

TEST_F(InstallationActivationTest, ARefusedReadyEnablesNothing) {
  const PlugIn plain = install("plain");
  const PlugIn guarded =
      install("guarded", {}, Dictionary{{"XOExtensionHostEntitlement", "com.example.may-host"}});

  Finished refused = runQvctl(root_, {"ready", "--env", "HOME=/h", plain.uuid.toString()});
  EXPECT_TRUE(refusedWith(refused, 11,
                          std::string("Transmission of environment variables requires the ") +
                              kProvider + " host entitlement"))
      << refused.err;
  EXPECT_EQ(recorded(), Identifiers{});

  // Every plug-in is checked before any is enabled: the allowed one listed
  // first is not enabled either.
  refused = runQvctl(root_, {"ready", plain.uuid.toString(), guarded.uuid.toString()});
  EXPECT_TRUE(refusedWith(refused, 11,
                          "access to plugin " + guarded.identifier +
                              " denied: the host does not have the \"com.example.may-host\" "
                              "entitlement"))
      << refused.err;
  EXPECT_EQ(recorded(), Identifiers{});

  const Finished entitled =
      runProcess({host("may-host", Dictionary{{"com.example.may-host", true}}), "ready",
                  plain.uuid.toString(), guarded.uuid.toString()},
                 root_.path());
  EXPECT_EQ(entitled.status, 0) << entitled.err;
  EXPECT_EQ(recorded(), (Identifiers{plain.identifier, guarded.identifier}));
}

TEST_F(InstallationActivationTest, AFailureToEnableOnePlugInLeavesTheNextEnabledAndIsReported) {
  const PlugIn gone = install("gone");
  const PlugIn kept = install("kept");
  // Still known to the daemon, but no bundle is left to name an executable.
  fs::remove_all(gone.path);

  const Finished ready = runQvctl(root_, {"ready", gone.uuid.toString(), kept.uuid.toString()});
  EXPECT_TRUE(refusedWith(ready, 4,
                          "cannot obtain executable path for plug-in " + gone.identifier + "(" +
                              gone.uuid.toString() + ")"))
      << ready.err;
  EXPECT_EQ(recorded(), Identifiers{kept.identifier}) << daemon_.log();
}

// A bundle without its executable file is enabled by its own directory, and
// filed under its own identifier, wherever it lies.
TEST_F(InstallationActivationTest, APlugInWithoutItsExecutableIsEnabledByItsOwnDirectory) {
  const std::string app = root_ / "Applications/Shop.app";
  writeVmapFile(app + "/Info.vmap",
                Dictionary{{"BXBundleIdentifier", identifier("shop")}, {"BXExecutable", "Shop"}});
  for (const PlugIn& plugIn : {writeBundle(systemBundle("bare"), "bare", {}, {}, false),
                               writeBundle(app + "/PlugIns/Cart.ovx", "cart", {}, {}, false)}) {
    fs::remove_all(root_ / "run/quorvex/lumend");
    ASSERT_EQ(runQvctl(root_, {"add", plugIn.path}).status, 0);
    const Uuid uuid = uuidOf(plugIn.path);
    ASSERT_FALSE(uuid.isNull());
    const Finished ready = runQvctl(root_, {"ready", uuid.toString()});
    EXPECT_EQ(ready.status, 0) << ready.err;
    EXPECT_EQ(records(), (Records{{plugIn.identifier, expectedRecord(plugIn, plugIn.path)}}))
        << plugIn.path;
  }
}

// The test process consumes the tokens as their host would.
TEST_F(InstallationActivationTest, AccessTokensAreConsumableAndForgeriesAreRefused) {
  const PlugIn first = install("first");
  const PlugIn second = install("second");
  const Finished access =
      runQvctl(root_, {"access", second.uuid.toString(), first.uuid.toString()});
  ASSERT_EQ(access.status, 0) << access.err;
  std::istringstream lines(access.out);
  std::vector<std::string> tokens;
  // Printed as a list under "extensions:", one "  - TOKEN" line each.
  for (std::string line; std::getline(lines, line);) {
    if (line.starts_with("  - ")) tokens.push_back(line.substr(4));
  }
  ASSERT_EQ(tokens.size(), 2u) << access.out;

  platform::sandbox::LinuxSandboxExtensions consumer(
      root_ / std::string(platform::sandbox::kSigningKeyRelativePath));
  const std::vector<std::string> expected{second.path, first.path};
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    auto handle = consumer.consume(tokens[i]);
    ASSERT_TRUE(handle.ok()) << tokens[i] << ": " << handle.error().description();
    const auto grant = platform::sandbox::LinuxSandboxExtensions::grantForHandle(*handle);
    ASSERT_TRUE(grant.has_value());
    EXPECT_EQ(grant->subject, expected[i]) << "in the order asked";
    EXPECT_EQ(grant->kind, platform::sandbox::ExtensionKind::File);
    EXPECT_TRUE(consumer.release(*handle).ok());
  }

  // Forgeries: one character changed, in the path or in the signature; the
  // first token's signature under the second's body; a token for /etc
  // signed with a key the forger made (another root's).
  const std::string token = tokens[0];
  const auto signatureOf = [](const std::string& t) { return t.substr(t.rfind(';')); };
  const auto bodyOf = [](const std::string& t) { return t.substr(0, t.rfind(';')); };
  std::vector<std::string> forged{bodyOf(tokens[1]) + signatureOf(token)};
  for (std::size_t at : {token.find(second.path) + second.path.size() - 1, token.size() - 1}) {
    forged.push_back(token);
    forged.back()[at] = forged.back()[at] == 'a' ? 'b' : 'a';
  }
  TemporaryRoot forgers;
  platform::sandbox::LinuxSandboxExtensions forger(
      forgers / std::string(platform::sandbox::kSigningKeyRelativePath));
  auto own = forger.issueFileExtension("/etc", platform::sandbox::PathResolution::AsGiven);
  ASSERT_TRUE(own.ok()) << own.error().description();
  forged.push_back(*own);
  for (const std::string& attempt : forged) {
    auto handle = consumer.consume(attempt);
    ASSERT_FALSE(handle.ok()) << attempt;
    EXPECT_EQ(platform::sandbox::sandboxErrno(handle.error()), EPERM) << attempt;
  }
}

}  // namespace
}  // namespace qvd::integration
