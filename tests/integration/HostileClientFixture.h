// What the hostile-client tests share: a daemon on a root with plug-ins
// (one of them sharing links out of its bundle), raw connections to it, the
// check that a fresh well-behaved client is still served, and readings of
// the daemon's descriptors and memory.
#pragma once
#include <gtest/gtest.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/resource.h>

#include <filesystem>
#include <fstream>
#include <functional>
#include <optional>
#include <set>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVSandboxExtensionConstants.h"
#include "platform/sandbox/SandboxToken.h"
#include "platform/values/Array.h"
#include "platform/values/Dictionary.h"
#include "tests/integration/DaemonHarness.h"
#include "tests/integration/RawSocketClient.h"
#include "tests/integration/RootContents.h"

namespace qvd::integration {

using platform::Array;
using platform::Dictionary;
using platform::Value;
using Error = std::pair<std::uint64_t, std::string>;

inline Dictionary request(std::string_view name, Dictionary keys = {}) {
  keys.set(QVDRequestKey, std::string(name));
  if (keys.find(QVDVersionKey) == nullptr) keys.set(QVDVersionKey, 3);
  return keys;
}

// Descriptors the process holds open; -1 when they cannot be listed.
inline int openDescriptors(pid_t pid) {
  std::error_code error;
  int count = 0;
  for (std::filesystem::directory_iterator it("/proc/" + std::to_string(pid) + "/fd", error), end;
       !error && it != end; it.increment(error)) {
    ++count;
  }
  return error ? -1 : count;
}

// The process's descriptor count once it has held still for 200 ms: the
// daemon closes the sockets of clients that have gone a moment after they go.
inline int settledDescriptors(pid_t pid) {
  int last = openDescriptors(pid);
  int steady = 0;
  const auto deadline = std::chrono::steady_clock::now() + 5s;
  while (steady < 10 && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(20ms);
    const int now = openDescriptors(pid);
    steady = now == last ? steady + 1 : 0;
    last = now;
  }
  return last;
}

// The process's resident set in KiB; -1 when it cannot be read.
inline long residentKiB(pid_t pid) {
  std::ifstream status("/proc/" + std::to_string(pid) + "/status");
  for (std::string line; std::getline(status, line);) {
    if (line.rfind("VmRSS:", 0) == 0) return std::strtol(line.c_str() + 6, nullptr, 10);
  }
  return -1;
}

inline const Array* matchesOf(const Value& reply) {
  return reply.dictionary() ? reply.dictionary()->get(QVDMatchesKey).array() : nullptr;
}

inline std::set<std::string> identifiersIn(const Value& reply) {
  std::set<std::string> identifiers;
  if (const Array* matches = matchesOf(reply)) {
    for (const Value& form : *matches) {
      const std::string* id =
          form.dictionary() ? form.dictionary()->get(QVFormIdentifierKey).string() : nullptr;
      identifiers.insert(id ? *id : "<no identifier>");
    }
  }
  return identifiers;
}

class HostileClientTest : public ::testing::Test {
 protected:
  static void SetUpTestSuite() {
    // A thousand connections need as many descriptors here, and in the daemon,
    // which inherits this limit.
    rlimit limit{};
    if (::getrlimit(RLIMIT_NOFILE, &limit) == 0 && limit.rlim_cur < 4096) {
      limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 4096);
      ::setrlimit(RLIMIT_NOFILE, &limit);
    }
  }

  void SetUp() override {
    alpha_ = writeSystemPlugIn(root_, "alpha");
    writeSystemPlugIn(root_, "beta");
    writeLinkingPlugIn();
    daemon_.emplace(root_, std::vector<std::string>{});
    ASSERT_TRUE(daemon_->waitUntilServing()) << daemon_->log();
    std::optional<RawSocketClient> probe = connect();
    ASSERT_TRUE(probe.has_value());
    pid_ = probe->peerPid();
    ASSERT_GT(pid_, 0);
  }
  void TearDown() override {
    // Exit status 0 on SIGTERM: nothing crashed or wedged the daemon on the way.
    if (daemon_) {
      EXPECT_EQ(daemon_->terminate(), 0) << daemon_->log();
    }
  }

  std::optional<RawSocketClient> connect() const {
    return RawSocketClient::connect(root_ / "run/quorvex/mbx/com.corvane.quorvex.qvd");
  }

  // A fresh, well-behaved client (a process of its own, on the real client
  // library) still finds alpha by its bundle URL.
  ::testing::AssertionResult stillServing() const {
    ClientRun run = sendRequest(
        root_, Value(request(QVDFindRequest, {{std::string(QVDPathsKey), "file://" + alpha_}})));
    if (run.finished.status != 0) {
      return ::testing::AssertionFailure()
             << "client status " << run.finished.status << ": " << run.finished.err;
    }
    const Dictionary* body = run.reply.dictionary();
    const Dictionary* form = body ? body->get(QVDMatchesKey).dictionary() : nullptr;
    const std::string* id = form ? form->get(QVFormIdentifierKey).string() : nullptr;
    if (id == nullptr || *id != "com.example.alpha") {
      return ::testing::AssertionFailure() << "unexpected reply " << run.reply.description();
    }
    return ::testing::AssertionSuccess();
  }

  bool logGains(const std::string& text, int before) const {
    return eventually([&] { return daemon_->countLines(text) > before; }, 5s);
  }

  // A plug-in (not an application extension, so it names what it shares)
  // whose shared entries include links out of its bundle.
  void writeLinkingPlugIn() {
    linker_ = root_ / "System/Library/PlugIns/linker.plugin";
    const Dictionary extension{
        {"XOExtensionPointIdentifier", "com.example.point"},
        {"XOExtensionProtocol", Array{"QVWidget"}},
        {"XOExtensionAttributes", Dictionary{{"Kind", "test"}}},
        {std::string(QVSharedResourcesInfoKey),
         Array{"Resources", "inner", "peer", "peerfile", "system", "../alpha.ovx"}}};
    writeVmapFile(linker_ + "/Info.vmap", Dictionary{{"BXBundleIdentifier", "com.example.linker"},
                                                     {"BXBundleShortVersionString", "1.0"},
                                                     {"BXExecutable", "Plug"},
                                                     {"XOExtension", extension}});
    std::filesystem::create_directories(linker_ + "/Resources");
    std::ofstream(linker_ + "/Resources/data") << "shared";
    namespace fs = std::filesystem;
    fs::create_directory_symlink("Resources", linker_ + "/inner");
    fs::create_directory_symlink("../alpha.ovx", linker_ + "/peer");
    fs::create_symlink("../alpha.ovx/Info.vmap", linker_ + "/peerfile");
    fs::create_directory_symlink("/etc", linker_ + "/system");
  }

  TemporaryRoot root_;
  std::string alpha_;
  std::string linker_;
  std::optional<Daemon> daemon_;
  pid_t pid_ = -1;
};

// A request frame (id 1) around `body`, however broken `body` is.
inline std::vector<std::uint8_t> requestFrame(const std::vector<std::uint8_t>& body) {
  return rawFrame(header(1, 1, static_cast<std::uint32_t>(body.size())), body);
}

}  // namespace qvd::integration
