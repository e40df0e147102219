// What the platform tests of holds share: a temporary directory, plug-in
// bundles written into it, and locks the test process itself holds.
#pragma once

#include <fcntl.h>
#include <stdlib.h>
#include <sys/file.h>
#include <unistd.h>

#include <filesystem>
#include <string>

#include "platform/values/Dictionary.h"
#include "platform/vmap/AtomicFile.h"

namespace qvd::holds_testing {

// A fresh directory under /tmp (canonical, so /proc paths compare equal),
// removed with everything in it.
struct TempDir {
  TempDir() {
    std::string pattern = "/tmp/qv-holds-XXXXXX";
    path = std::filesystem::canonical(::mkdtemp(pattern.data())).string();
  }
  ~TempDir() {
    std::error_code ignored;
    std::filesystem::remove_all(path, ignored);
  }
  std::string operator/(const std::string& relative) const { return path + "/" + relative; }
  std::string path;
};

// A plug-in bundle directory with an Info.vmap naming `identifier`.
inline std::string writeBundle(const std::string& directory, const std::string& identifier) {
  std::filesystem::create_directories(directory);
  (void)platform::vmap::writeFileAtomically(
      directory + "/Info.vmap",
      platform::Value(platform::Dictionary{{"BXBundleIdentifier", identifier},
                                           {"BXExecutable", "Plug"},
                                           {"XOExtension", platform::Dictionary()}}),
      platform::vmap::Format::Xml);
  return directory;
}

// An exclusive flock held by this process on `path` (created), as a busy
// plug-in would hold it, until destruction.
class HeldLock {
 public:
  explicit HeldLock(const std::string& path)
      : fd_(::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644)) {
    if (fd_ >= 0 && ::flock(fd_, LOCK_EX | LOCK_NB) != 0) {
      ::close(fd_);
      fd_ = -1;
    }
  }
  ~HeldLock() {
    if (fd_ >= 0) ::close(fd_);
  }
  HeldLock(const HeldLock&) = delete;
  HeldLock& operator=(const HeldLock&) = delete;
  bool held() const { return fd_ >= 0; }

 private:
  int fd_;
};

}  // namespace qvd::holds_testing
