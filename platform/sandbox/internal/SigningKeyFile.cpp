#include "platform/sandbox/internal/SigningKeyFile.h"

#include <fcntl.h>
#include <sys/random.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <filesystem>
#include <system_error>

namespace platform::sandbox::internal {
namespace {

// Another process may create the key between our look and our link; after
// that it exists, so a second look finds it. More rounds only cover a key
// removed again at once.
constexpr int kAttempts = 4;

class Descriptor {
 public:
  explicit Descriptor(int fd) : fd_(fd) {}
  ~Descriptor() {
    if (fd_ >= 0) ::close(fd_);
  }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  int get() const { return fd_; }
  // Closes now, reporting what close said.
  int close() {
    const int result = ::close(fd_);
    fd_ = -1;
    return result;
  }

 private:
  int fd_;
};

std::string octalMode(mode_t mode) {
  char text[16];
  std::snprintf(text, sizeof text, "%04o", static_cast<unsigned>(mode & 07777));
  return text;
}

Result<SigningKey> readKey(const std::string& path) {
  Descriptor fd(::open(path.c_str(), O_RDONLY | O_NOFOLLOW | O_CLOEXEC | O_NOCTTY));
  if (fd.get() < 0) return Error::posix(errno, "open " + path);
  struct stat info {};
  if (::fstat(fd.get(), &info) != 0) return Error::posix(errno, "stat " + path);
  if (!S_ISREG(info.st_mode)) return Error::posix(EINVAL, path + " is not a regular file");
  if (info.st_uid != ::geteuid()) {
    return Error::posix(EACCES, path + " is owned by uid " + std::to_string(info.st_uid));
  }
  if ((info.st_mode & 077) != 0) {
    return Error::posix(EACCES, path + " may be accessed by group or others (mode " +
                                    octalMode(info.st_mode) + ")");
  }
  if (info.st_size != static_cast<off_t>(kSigningKeyBytes)) {
    return Error::posix(EINVAL, path + " holds " + std::to_string(info.st_size) +
                                    " bytes, not " + std::to_string(kSigningKeyBytes));
  }
  SigningKey key{};
  std::size_t got = 0;
  while (got < key.size()) {
    const ssize_t n = ::pread(fd.get(), key.data() + got, key.size() - got,
                              static_cast<off_t>(got));
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::posix(errno, "read " + path);
    if (n == 0) return Error::posix(EINVAL, path + " shrank while being read");
    got += static_cast<std::size_t>(n);
  }
  return key;
}

Result<SigningKey> randomKey() {
  SigningKey key{};
  std::size_t got = 0;
  while (got < key.size()) {
    const ssize_t n = ::getrandom(key.data() + got, key.size() - got, 0);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::posix(errno, "getrandom");
    got += static_cast<std::size_t>(n);
  }
  return key;
}

Status writeAll(int fd, const SigningKey& key, const std::string& path) {
  std::size_t done = 0;
  while (done < key.size()) {
    const ssize_t n = ::write(fd, key.data() + done, key.size() - done);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::posix(errno, "write " + path);
    done += static_cast<std::size_t>(n);
  }
  return okStatus();
}

// Writes a new key beside `path` and links it into place. EEXIST when
// another maker got there first.
Result<SigningKey> createKey(const std::string& path) {
  const std::filesystem::path folder = std::filesystem::path(path).parent_path();
  std::error_code ec;
  std::filesystem::create_directories(folder, ec);
  if (ec) return Error::posix(ec.value(), "mkdir " + folder.string());

  Result<SigningKey> key = randomKey();
  if (!key.ok()) return key.error();
  std::string temporary = path + ".new.XXXXXX";
  // mkostemp opens with O_EXCL and mode 0600.
  Descriptor fd(::mkostemp(temporary.data(), O_CLOEXEC));
  if (fd.get() < 0) return Error::posix(errno, "create " + temporary);
  Status written = writeAll(fd.get(), *key, temporary);
  if (written.ok() && ::fchmod(fd.get(), 0600) != 0) written = Error::posix(errno, "chmod");
  if (written.ok() && ::fsync(fd.get()) != 0) written = Error::posix(errno, "fsync " + temporary);
  if (written.ok() && fd.close() != 0) written = Error::posix(errno, "close " + temporary);
  if (!written.ok()) {
    ::unlink(temporary.c_str());
    return written.error();
  }
  const int linked = ::link(temporary.c_str(), path.c_str());
  const int linkErrno = errno;
  ::unlink(temporary.c_str());
  if (linked != 0) return Error::posix(linkErrno, "link " + path);
  return key;
}

}  // namespace

Result<SigningKey> loadOrCreateSigningKey(const std::string& path) {
  for (int attempt = 0;; ++attempt) {
    Result<SigningKey> existing = readKey(path);
    if (existing.ok() || existing.error().code() != ENOENT || attempt + 1 == kAttempts) {
      return existing;
    }
    Result<SigningKey> made = createKey(path);
    if (made.ok() || made.error().code() != EEXIST) return made;
  }
}

}  // namespace platform::sandbox::internal
