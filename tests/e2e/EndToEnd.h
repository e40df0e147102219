// The system as its users meet it: the real daemon on a temporary platform
// root, an installer and hosts that are separate processes, each running an
// executable copy of its own under <root>/bin so that a grant file can give
// it entitlements (the daemon knows a client by the executable behind its
// connection). Plug-ins are written after the daemon started and added by
// the installer, as a package installer would.
#pragma once

#include <gtest/gtest.h>
#include <unistd.h>

#include <filesystem>
#include <nlohmann/json.hpp>
#include <optional>
#include <set>
#include <sstream>
#include <string>
#include <vector>

#include "Quorvex/QVDConstants.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Uuid.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RootContents.h"
#include "tests/unit/holds/PlugInProcess.h"

namespace qvd::e2e {

using integration::Finished;
using platform::Dictionary;
using platform::Uuid;
using Ids = std::set<std::string>;
namespace fs = std::filesystem;

inline constexpr const char* kPoint = "com.example.e2e";
// What the guarded plug-in demands of its hosts.
inline constexpr const char* kMayHost = "com.example.may-host";

struct PlugIn {
  std::string path;
  std::string identifier;
};

class EndToEnd : public ::testing::Test {
 protected:
  void SetUp() override {
    installer_ =
        grantedCopy("installer", QVCTL_PATH, Dictionary{{std::string(QVManagerEntitlement), true}});
    entitled_ = grantedCopy("entitled-host", QVCTL_PATH, Dictionary{{kMayHost, true}});
    plain_ = grantedCopy("plain-host", QVCTL_PATH, Dictionary{{"com.example.unrelated", true}});
    start();
  }
  void TearDown() override {
    if (daemon_) stop();
  }

  void start() {
    daemon_.emplace(root_, std::vector<std::string>{});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
  }
  // Ends the daemon by SIGTERM, as the system does. Its log (which the next
  // start overwrites) must show no fault and no error line.
  void stop() {
    std::istringstream lines(daemon_->log());
    std::string faults;
    for (std::string line; std::getline(lines, line);) {
      if (line.find("<Fault>") != std::string::npos || line.find("<Error>") != std::string::npos) {
        faults += line + "\n";
      }
    }
    EXPECT_EQ(faults, "");
    EXPECT_EQ(daemon_->terminate(), 0) << daemon_->log();
    daemon_.reset();
  }
  void restart() {
    stop();
    start();
  }

  // A copy of `program` at <root>/bin/<name>, granted `entitlements`.
  std::string grantedCopy(const std::string& name, const std::string& program,
                          const Dictionary& entitlements) {
    const std::string executable = root_ / ("bin/" + name);
    fs::create_directories(root_ / "bin");
    fs::copy_file(program, executable);
    const std::string grant = root_ / ("etc/quorvex/entitlements/" + name + ".vmap");
    integration::writeVmapFile(
        grant, Dictionary{{"executable", executable}, {"entitlements", entitlements}});
    // A grant that others may write counts for nothing.
    fs::permissions(grant, fs::perms::owner_read | fs::perms::owner_write | fs::perms::group_read |
                               fs::perms::others_read);
    return executable;
  }

  // Removal ends every process of the system whose executable lies in a
  // bundle with the identifier: these are this test process's own.
  std::string identifier(const std::string& name) const {
    return "com.example." + name + std::to_string(::getpid());
  }
  // A system plug-in bundle on kPoint (not yet added); `extension` adds to
  // its XOExtension. Its executable is a real plug-in process program.
  PlugIn writeBundle(const std::string& name, const Dictionary& extension = {},
                     bool withExecutable = true) {
    const std::string bundle = root_ / ("System/Library/PlugIns/" + name + ".ovx");
    Dictionary point{{"XOExtensionPointIdentifier", kPoint}};
    for (const auto& [key, value] : extension) point.set(key, value);
    integration::writeVmapFile(bundle + "/Info.vmap",
                               Dictionary{{"BXBundleIdentifier", identifier(name)},
                                          {"BXBundleShortVersionString", "1.0"},
                                          {"BXExecutable", "Plug"},
                                          {"XOExtension", point}});
    if (withExecutable) holds_testing::installPlugInExecutable(bundle);
    return PlugIn{bundle, identifier(name)};
  }
  PlugIn guardedBundle(const std::string& name) {
    return writeBundle(name, Dictionary{{std::string(QVHostEntitlementInfoKey), kMayHost}});
  }
  void install(const std::vector<PlugIn>& plugIns) {
    std::vector<std::string> arguments{"add"};
    for (const PlugIn& plugIn : plugIns) arguments.push_back(plugIn.path);
    const Finished added = run(installer_, arguments);
    ASSERT_EQ(added.status, 0) << added.err << daemon_->log();
  }

  Finished run(const std::string& host, std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), host);
    return integration::runProcess(arguments, root_.path());
  }
  // The reply qvctl printed with --json; null (and a failure) for none.
  nlohmann::json json(const std::string& host, std::vector<std::string> arguments) {
    arguments.insert(arguments.begin(), "--json");
    const Finished done = run(host, arguments);
    EXPECT_EQ(done.status, 0) << done.err;
    return nlohmann::json::parse(done.out, nullptr, false);
  }
  // The identifiers a host's match on kPoint (and `rules`) shows.
  Ids matched(const std::string& host, const std::vector<std::string>& rules = {}) {
    std::vector<std::string> arguments{"match", std::string("XOExtensionPointName=") + kPoint};
    arguments.insert(arguments.end(), rules.begin(), rules.end());
    const nlohmann::json reply = json(host, arguments);
    if (!reply.contains("matches") || !reply["matches"].is_array()) return {"(no matches)"};
    Ids ids;
    for (const nlohmann::json& form : reply["matches"]) ids.insert(form.value("identifier", "?"));
    return ids;
  }
  // The plug-in form "find" shows the host for a path or UUID; null when none.
  nlohmann::json found(const std::string& host, const std::string& pathOrUuid) {
    const Finished done = run(host, {"--json", "find", pathOrUuid});
    const nlohmann::json reply = nlohmann::json::parse(done.out, nullptr, false);
    return done.status == 0 && reply.contains("matches") ? reply["matches"] : nlohmann::json();
  }
  std::string uuidOf(const std::string& host, const std::string& path) {
    const nlohmann::json form = found(host, path);
    return form.is_object() ? form.value("uuid", "") : "";
  }

  integration::TemporaryRoot root_;
  std::optional<integration::Daemon> daemon_;
  std::string installer_, entitled_, plain_;
};

// Whether qvctl failed with the daemon's error `code` and `message`.
inline bool refusedWith(const Finished& run, int code, const std::string& message) {
  return run.status == 1 && run.err.find("qvctl: error " + std::to_string(code) + ": " + message +
                                         "\n") != std::string::npos;
}

}  // namespace qvd::e2e
