// LinuxSandboxExtensions in one process: the key file, issuing, consuming,
// refusing altered tokens.
#include <gtest/gtest.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "SandboxTestSupport.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"

namespace platform::sandbox {
namespace {

namespace fs = std::filesystem;
using sandbox_testing::TemporaryRoot;

class LinuxSandboxExtensionsTest : public ::testing::Test {
 protected:
  std::string issueFile(const std::string& path) {
    Result<std::string> token = extensions_.issueFileExtension(path, PathResolution::Canonicalise);
    EXPECT_TRUE(token.ok()) << (token.ok() ? "" : token.error().description());
    return token.ok() ? *token : std::string();
  }
  int consumeErrno(const std::string& token) {
    Result<std::int64_t> handle = extensions_.consume(token);
    if (handle.ok()) {
      EXPECT_TRUE(extensions_.release(*handle).ok());
      return 0;
    }
    return sandboxErrno(handle.error());
  }

  TemporaryRoot root_;
  LinuxSandboxExtensions extensions_;
};

TEST_F(LinuxSandboxExtensionsTest, KeyIsMadeOwnerOnlyAtFirstUse) {
  EXPECT_FALSE(fs::exists(root_.keyPath()));
  const std::string token = issueFile(root_.path());
  struct stat info {};
  ASSERT_EQ(::stat(root_.keyPath().c_str(), &info), 0);
  EXPECT_EQ(info.st_mode & 07777, 0600u);
  EXPECT_EQ(info.st_size, 32);
  // Nothing of the temporary file is left beside it.
  EXPECT_EQ(std::distance(fs::directory_iterator(fs::path(root_.keyPath()).parent_path()),
                          fs::directory_iterator()),
            1);
  // Another instance reads the same key: it accepts the token.
  LinuxSandboxExtensions second;
  Result<std::int64_t> handle = second.consume(token);
  ASSERT_TRUE(handle.ok()) << handle.error().description();
  EXPECT_TRUE(second.release(*handle).ok());
}

// A token names the file itself: links and ".." on the way are resolved,
// so a host holding it cannot be steered elsewhere by changing a link, and a
// path that names nothing gets no token.
TEST_F(LinuxSandboxExtensionsTest, CanonicalisedSubjectsNameTheFileItself) {
  const std::string real = root_.path() + "/real/Bundle.ovx";
  fs::create_directories(real + "/Resources");
  fs::create_directory_symlink(root_.path() + "/real", root_.path() + "/link");
  fs::create_directory_symlink(real + "/Resources", real + "/alias");
  const std::string canonical = fs::canonical(real).string();
  const std::pair<std::string, std::string> cases[] = {
      {root_.path() + "/link/Bundle.ovx", canonical},
      {root_.path() + "/link/../real/Bundle.ovx/", canonical},
      {real + "/alias", canonical + "/Resources"},
  };
  for (const auto& [given, expected] : cases) {
    const std::string token = issueFile(given);
    Result<std::int64_t> handle = extensions_.consume(token);
    ASSERT_TRUE(handle.ok()) << given;
    std::optional<ExtensionGrant> grant = LinuxSandboxExtensions::grantForHandle(*handle);
    ASSERT_TRUE(grant.has_value());
    EXPECT_EQ(grant->subject, expected) << given;
    EXPECT_TRUE(extensions_.release(*handle).ok());
  }
  Result<std::string> missing =
      extensions_.issueFileExtension(root_.path() + "/link/Gone.ovx", PathResolution::Canonicalise);
  ASSERT_FALSE(missing.ok());
  EXPECT_EQ(sandboxErrno(missing.error()), ENOENT);
}

TEST_F(LinuxSandboxExtensionsTest, ConcurrentFirstUsersAgreeOnOneKey) {
  std::vector<std::string> tokens(6);
  std::vector<std::thread> threads;
  for (std::size_t i = 0; i < tokens.size(); ++i) {
    threads.emplace_back([&, i] {
      LinuxSandboxExtensions own;
      Result<std::string> token = own.issueServiceExtension("c", "svc" + std::to_string(i));
      if (token.ok()) tokens[i] = *token;
    });
  }
  for (std::thread& t : threads) t.join();
  for (const std::string& token : tokens) EXPECT_EQ(consumeErrno(token), 0) << token;
}

TEST_F(LinuxSandboxExtensionsTest, UnsafeKeyFilesAreRefusedAndKept) {
  struct Case {
    const char* name;
    mode_t mode;
    std::size_t size;
    int err;
  } cases[] = {
      {"group-readable", 0640, 32, EACCES},
      {"group-writable", 0620, 32, EACCES},
      {"short", 0600, 31, EINVAL},
  };
  for (const Case& c : cases) {
    fs::create_directories(fs::path(root_.keyPath()).parent_path());
    fs::remove(root_.keyPath());
    const std::string contents(c.size, 'k');
    std::ofstream(root_.keyPath(), std::ios::binary) << contents;
    ASSERT_EQ(::chmod(root_.keyPath().c_str(), c.mode), 0);

    sandbox_testing::VerboseCapture capture;
    LinuxSandboxExtensions fresh;
    Result<std::string> token = fresh.issueServiceExtension("c", "svc");
    ASSERT_FALSE(token.ok()) << c.name;
    EXPECT_EQ(sandboxErrno(token.error()), c.err) << c.name;
    EXPECT_EQ(fs::file_size(root_.keyPath()), c.size) << c.name << ": key replaced";
    std::vector<platform::log::CapturedLine> lines = capture.lines().lines();
    ASSERT_EQ(lines.size(), 1u) << c.name;
    EXPECT_EQ(lines[0].level, platform::log::Level::Error);
    EXPECT_NE(lines[0].message.find("sandbox signing key unusable: " + root_.keyPath()),
              std::string::npos)
        << lines[0].message;
  }
}

TEST_F(LinuxSandboxExtensionsTest, SymlinkedKeyIsRefused) {
  const std::string good = root_.path() + "/elsewhere";
  std::ofstream(good, std::ios::binary) << std::string(32, 'k');
  ASSERT_EQ(::chmod(good.c_str(), 0600), 0);
  fs::create_directories(fs::path(root_.keyPath()).parent_path());
  fs::create_symlink(good, root_.keyPath());
  Result<std::string> token = extensions_.issueServiceExtension("c", "svc");
  ASSERT_FALSE(token.ok());
  EXPECT_EQ(sandboxErrno(token.error()), ELOOP);
}

TEST_F(LinuxSandboxExtensionsTest, EveryChangedByteIsRefused) {
  const std::string token = issueFile(root_.path());
  ASSERT_EQ(consumeErrno(token), 0);
  for (std::size_t i = 0; i < token.size(); ++i) {
    for (char replacement : {'x', '0', ';', '%'}) {
      if (token[i] == replacement) continue;
      std::string altered = token;
      altered[i] = replacement;
      const int err = consumeErrno(altered);
      EXPECT_TRUE(err == EPERM || err == EINVAL) << "byte " << i << " -> " << replacement
                                                  << " gave " << err;
    }
  }
}

}  // namespace
}  // namespace platform::sandbox
