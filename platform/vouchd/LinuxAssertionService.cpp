#include "platform/vouchd/LinuxAssertionService.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <optional>
#include <utility>

#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"

namespace platform::vouchd {

namespace {

const log::Logger& vouchdLog() {
  static const log::Logger& logger = log::platformLog("vouchd");
  return logger;
}

// Linux never hands out a pid above 2^22.
constexpr long kMaxPid = 1L << 22;

// The pid an entry name stands for: decimal digits without a leading zero.
std::optional<int> pidFromName(std::string_view name) {
  if (name.empty() || name.size() > 7 || name.front() == '0') return std::nullopt;
  long pid = 0;
  for (char c : name) {
    if (c < '0' || c > '9') return std::nullopt;
    pid = pid * 10 + (c - '0');
  }
  if (pid > kMaxPid) return std::nullopt;
  return static_cast<int>(pid);
}

enum class LockState { Held, Free, Unusable };

// Whether another open file description holds an exclusive lock on the
// entry: a shared lock can then not be had. The entry is never followed
// through a link and never opened for writing.
LockState lockStateOf(int directory, const char* name, const std::string& directoryPath) {
  const int fd =
      ::openat(directory, name, O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK | O_NOCTTY);
  if (fd < 0) {
    // Gone meanwhile, or a link (never followed): nothing to say. Anything
    // else means a busy plug-in may be taken for an idle one.
    if (errno != ENOENT && errno != ELOOP) {
      vouchdLog().error("cannot probe assertion %{public}s/%{public}s: %{errno}d", directoryPath,
                        name, errno);
    }
    return LockState::Unusable;
  }
  struct stat status {};
  LockState state = LockState::Unusable;
  if (::fstat(fd, &status) == 0 && S_ISREG(status.st_mode)) {
    if (::flock(fd, LOCK_SH | LOCK_NB) == 0) {
      state = LockState::Free;  // closing the descriptor drops our probe lock
    } else if (errno == EWOULDBLOCK) {
      state = LockState::Held;
    }
  }
  ::close(fd);
  return state;
}

}  // namespace

bool isAssertableBundleIdentifier(std::string_view identifier) {
  return !identifier.empty() && identifier.size() <= 250 && identifier != "." &&
         identifier != ".." && identifier.find('/') == std::string_view::npos &&
         identifier.find('\0') == std::string_view::npos;
}

LinuxAssertionService::LinuxAssertionService()
    : LinuxAssertionService(rootPath("run/quorvex/assertions")) {}

LinuxAssertionService::LinuxAssertionService(std::string directory, AssertionLimits limits)
    : directory_(std::move(directory)), limits_(limits) {}

Result<std::vector<ExtensionInstance>> LinuxAssertionService::busyExtensionInstances(
    const std::set<std::string>& bundleIdentifiers) const {
  std::vector<ExtensionInstance> instances;
  for (const std::string& identifier : bundleIdentifiers) {
    if (!isAssertableBundleIdentifier(identifier)) continue;
    if (Status collected = collect(identifier, instances); !collected.ok()) {
      return collected.error();
    }
  }
  return instances;
}

Status LinuxAssertionService::collect(const std::string& bundleIdentifier,
                                      std::vector<ExtensionInstance>& instances) const {
  const std::string path = directory_ + "/" + bundleIdentifier;
  const int fd = ::open(path.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW);
  if (fd < 0) {
    // No directory: nothing of that bundle ever asserted anything.
    if (errno == ENOENT || errno == ENOTDIR) return okStatus();
    if (errno == ELOOP) {
      vouchdLog().error("assertion directory %{public}s is a link; ignored", path);
      return okStatus();
    }
    return Error::posix(errno, "open " + path);
  }
  DIR* directory = ::fdopendir(fd);
  if (directory == nullptr) {
    const int err = errno;
    ::close(fd);
    return Error::posix(err, "fdopendir " + path);
  }
  std::vector<ExtensionInstance> found;
  std::size_t seen = 0;
  while (const dirent* entry = ::readdir(directory)) {
    const std::string_view name(entry->d_name);
    if (name == "." || name == "..") continue;
    if (++seen > limits_.maxEntriesPerBundle) {
      vouchdLog().error("more than %zu entries in %{public}s; the rest are ignored",
                        limits_.maxEntriesPerBundle, path);
      break;
    }
    const std::optional<int> pid = pidFromName(name);
    if (!pid) continue;
    if (lockStateOf(::dirfd(directory), entry->d_name, path) != LockState::Held) continue;
    found.push_back(ExtensionInstance{
        *pid, Dictionary{{std::string(kInstanceBundleIdentifierKey), bundleIdentifier},
                         {std::string(kInstancePidKey), static_cast<std::int64_t>(*pid)}}});
  }
  ::closedir(directory);
  std::sort(found.begin(), found.end(),
            [](const ExtensionInstance& a, const ExtensionInstance& b) { return a.pid < b.pid; });
  instances.insert(instances.end(), std::make_move_iterator(found.begin()),
                   std::make_move_iterator(found.end()));
  return okStatus();
}

}  // namespace platform::vouchd
