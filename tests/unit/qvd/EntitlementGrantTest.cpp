// Entitlements follow the client's executable: two programs talking to one
// server get their own grants from disk; a world-writable grant grants nothing.
#include <gtest/gtest.h>
#include <spawn.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "Quorvex/QVDConstants.h"
#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/root/Root.h"
#include "platform/vmap/AtomicFile.h"
#include "tests/unit/qvd/QvdTestSupport.h"

extern char** environ;

namespace qvd::testing {
namespace {

using platform::Dictionary;
using platform::Value;

class EntitlementGrantTest : public ::testing::Test {
 protected:
  void SetUp() override {
    ASSERT_NE(testRoot(), "/");
    grants_ = platform::rootPath("etc/quorvex/entitlements");
    std::filesystem::create_directories(grants_);
  }
  void TearDown() override { std::filesystem::remove_all(grants_); }

  static void write(const std::string& path, const Dictionary& document) {
    ASSERT_TRUE(platform::vmap::writeFileAtomically(path, Value(document), platform::vmap::Format::Xml,
                                                    platform::vmap::FileOps::real())
                    .ok());
  }
  void grant(const std::string& file, const std::string& executable, Dictionary entitlements,
             mode_t mode = 0644) {
    write(grants_ + "/" + file, {{"executable", executable}, {"entitlements", entitlements}});
    ::chmod((grants_ + "/" + file).c_str(), mode);
  }

  // Runs the request client (another program) against `server`: its status.
  int runOtherProgram(const TestServer& server) {
    const std::string request = platform::rootPath("grant-request.vmap");
    write(request, testing::request("nope"));
    std::vector<std::string> args{REQUEST_CLIENT_PATH, "--service", server.serviceName(), request};
    std::vector<char*> argv;
    for (auto& a : args) argv.push_back(a.data());
    argv.push_back(nullptr);
    pid_t pid;
    if (posix_spawn(&pid, argv[0], nullptr, nullptr, argv.data(), environ) != 0) return -1;
    int status = 0;
    ::waitpid(pid, &status, 0);
    return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
  }

  std::string grants_;
  const std::string self_ = std::filesystem::canonical("/proc/self/exe").string();
  const std::string other_ = std::filesystem::canonical(REQUEST_CLIENT_PATH).string();
};

TEST_F(EntitlementGrantTest, EachExecutableGetsItsOwnGrants) {
  grant("self.vmap", self_, Dictionary{{std::string(QVManagerEntitlement), true}});
  grant("other.vmap", other_, Dictionary{{std::string(QVOverrideEntitlement), 1}});
  // Anyone could have written this one: it must not count.
  grant("loose.vmap", other_, Dictionary{{std::string(QVManagerEntitlement), true}}, 0666);
  TestServer server([](Platform& services) {
    services.entitlements = std::make_shared<platform::codesign::LinuxEntitlementStore>();
  });
  TestClient mine(server);
  ASSERT_TRUE(mine.call(request("nope")).ok());
  ASSERT_EQ(runOtherProgram(server), 0);
  ASSERT_TRUE(eventually([&] { return server.clients().size() == 2; }));
  const auto clients = server.clients();
  const auto& me = clients[0]->path() == self_ ? clients[0] : clients[1];
  const auto& other = clients[0]->path() == self_ ? clients[1] : clients[0];
  ASSERT_EQ(other->path(), other_);

  EXPECT_TRUE(me->hasEntitlement(QVManagerEntitlement));
  EXPECT_FALSE(me->hasEntitlement(QVOverrideEntitlement));
  EXPECT_FALSE(other->hasEntitlement(QVManagerEntitlement));
  EXPECT_TRUE(other->hasEntitlement(QVOverrideEntitlement));
  EXPECT_EQ(other->entitlementValueForKey(QVOverrideEntitlement), Value(1));
}

}  // namespace
}  // namespace qvd::testing
