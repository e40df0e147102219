#include "platform/notify/internal/CounterFile.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <unistd.h>

#include <charconv>
#include <limits>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/log/LoggerRegistry.h"
#include "platform/notify/NotifyError.h"

namespace platform::notify::internal {
namespace {

// Twenty digits hold any 64-bit count; one more byte tells a longer file.
constexpr std::size_t kMaxCounterBytes = 21;

const log::Logger& notifyLog() {
  static const log::Logger& logger = log::platformLog("notify");
  return logger;
}

class LockedFile {
 public:
  explicit LockedFile(int fd) : fd_(fd) {}
  ~LockedFile() {
    if (fd_ >= 0) ::close(fd_);  // also releases the lock
  }
  LockedFile(const LockedFile&) = delete;
  LockedFile& operator=(const LockedFile&) = delete;
  int fd() const { return fd_; }

  // Waits for the lock; another process holds it only for a few calls.
  Status lock(int operation, const std::string& path) {
    dispatch::ScopedBlockingCall blocking;
    while (::flock(fd_, operation) != 0) {
      if (errno != EINTR) return Error::posix(errno, "flock " + path);
    }
    return okStatus();
  }

 private:
  int fd_;
};

Status checkRegular(int fd, const std::string& path) {
  struct stat status {};
  if (::fstat(fd, &status) != 0) return Error::posix(errno, "fstat " + path);
  if (!S_ISREG(status.st_mode)) {
    return notifyError(NotifyErrorCode::NotARegularFile, path + ": not a regular file");
  }
  return okStatus();
}

// What the file holds, at most kMaxCounterBytes of it.
Result<std::string> readText(int fd, const std::string& path) {
  char buffer[kMaxCounterBytes + 1];
  ssize_t n;
  do {
    n = ::pread(fd, buffer, sizeof buffer, 0);
  } while (n < 0 && errno == EINTR);
  if (n < 0) return Error::posix(errno, "read " + path);
  return std::string(buffer, static_cast<std::size_t>(n));
}

}  // namespace

Status makeDirectories(const std::string& directory) {
  if (::mkdir(directory.c_str(), 0755) == 0 || errno == EEXIST) return okStatus();
  if (errno != ENOENT) return Error::posix(errno, "mkdir " + directory);
  const std::size_t slash = directory.find_last_of('/');
  if (slash == 0 || slash == std::string::npos) return Error::posix(ENOENT, "mkdir " + directory);
  if (Status parent = makeDirectories(directory.substr(0, slash)); !parent.ok()) return parent;
  if (::mkdir(directory.c_str(), 0755) == 0 || errno == EEXIST) return okStatus();
  return Error::posix(errno, "mkdir " + directory);
}

std::optional<std::uint64_t> parseCount(std::string_view text) {
  if (!text.empty() && text.back() == '\n') text.remove_suffix(1);
  if (text.empty()) return std::nullopt;
  std::uint64_t count = 0;
  auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), count);
  if (ec != std::errc() || end != text.data() + text.size()) return std::nullopt;
  return count;
}

Result<std::uint64_t> incrementCounter(const std::string& path) {
  LockedFile file(
      ::open(path.c_str(), O_RDWR | O_CREAT | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK, 0644));
  if (file.fd() < 0) return Error::posix(errno, "open " + path);
  if (Status regular = checkRegular(file.fd(), path); !regular.ok()) return regular.error();
  if (Status locked = file.lock(LOCK_EX, path); !locked.ok()) return locked.error();
  Result<std::string> text = readText(file.fd(), path);
  if (!text.ok()) return text.error();
  std::uint64_t count = 0;
  if (!text->empty()) {
    std::optional<std::uint64_t> parsed = parseCount(*text);
    if (parsed.has_value()) {
      count = *parsed;
    } else {
      notifyLog().error("counter %{public}s is not a number; starting again from zero", path);
    }
  }
  if (count == std::numeric_limits<std::uint64_t>::max()) {
    return notifyError(NotifyErrorCode::CounterOverflow, path + ": counter at its maximum");
  }
  ++count;
  const std::string next = std::to_string(count) + "\n";
  ssize_t written;
  do {
    written = ::pwrite(file.fd(), next.data(), next.size(), 0);
  } while (written < 0 && errno == EINTR);
  if (written < 0) return Error::posix(errno, "write " + path);
  if (static_cast<std::size_t>(written) != next.size()) {
    return Error::posix(EIO, "short write " + path);
  }
  // Only a restarted, malformed counter can be longer than the new text.
  if (text->size() > next.size() && ::ftruncate(file.fd(), static_cast<off_t>(next.size())) != 0) {
    return Error::posix(errno, "ftruncate " + path);
  }
  return count;
}

Result<std::uint64_t> readCounter(const std::string& path) {
  LockedFile file(::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW | O_NONBLOCK));
  if (file.fd() < 0) {
    if (errno == ENOENT) return std::uint64_t{0};
    return Error::posix(errno, "open " + path);
  }
  if (Status regular = checkRegular(file.fd(), path); !regular.ok()) return regular.error();
  if (Status locked = file.lock(LOCK_SH, path); !locked.ok()) return locked.error();
  Result<std::string> text = readText(file.fd(), path);
  if (!text.ok()) return text.error();
  if (text->empty()) return std::uint64_t{0};  // created by a post that has not written yet
  std::optional<std::uint64_t> count = parseCount(*text);
  if (!count.has_value()) {
    return notifyError(NotifyErrorCode::MalformedCounter, path + ": not a decimal count");
  }
  return *count;
}

}  // namespace platform::notify::internal
