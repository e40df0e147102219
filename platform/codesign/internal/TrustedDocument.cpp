#include "platform/codesign/internal/TrustedDocument.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdint>
#include <vector>

#include "platform/codesign/CodesignError.h"
#include "platform/codesign/FileTrust.h"
#include "platform/codesign/internal/ScopedFd.h"

namespace platform::codesign::internal {
namespace {

// Reads at most `limit` + 1 bytes, so that a file that grew after its fstat
// is still caught by the limit.
Result<std::vector<std::uint8_t>> readAll(int fd, const std::string& path, std::size_t limit) {
  std::vector<std::uint8_t> bytes;
  std::uint8_t buffer[16384];
  for (;;) {
    const ssize_t n = ::read(fd, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::posix(errno, "read " + path);
    if (n == 0) return bytes;
    bytes.insert(bytes.end(), buffer, buffer + n);
    if (bytes.size() > limit) {
      return codesignError(CodesignErrorCode::TooLarge,
                           path + ": larger than " + std::to_string(limit) + " bytes");
    }
  }
}

}  // namespace

Result<Value> readTrustedDocument(int directoryFd, const std::string& name, const std::string& path,
                                  uid_t daemonUid, const vmap::ReadLimits& limits,
                                  FileSignature* signature) {
  // O_NONBLOCK: opening a FIFO must not wait for a writer; it is refused below.
  ScopedFd fd(::openat(directoryFd, name.c_str(),
                       O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NOFOLLOW | O_NONBLOCK));
  if (!fd.valid()) {
    if (errno == ELOOP) {
      return codesignError(CodesignErrorCode::NotARegularFile, path + ": a symbolic link");
    }
    return Error::posix(errno, "open " + path);
  }
  struct stat status {};
  if (::fstat(fd.get(), &status) != 0) return Error::posix(errno, "fstat " + path);
  if (signature != nullptr) *signature = FileSignature::of(status);
  if (!S_ISREG(status.st_mode)) {
    return codesignError(CodesignErrorCode::NotARegularFile, path + ": not a regular file");
  }
  if (auto reason = distrustReason(status, daemonUid)) {
    return codesignError(CodesignErrorCode::Untrusted, path + ": " + *reason);
  }
  if (static_cast<std::uint64_t>(status.st_size) > limits.maxBytes) {
    return codesignError(CodesignErrorCode::TooLarge,
                         path + ": larger than " + std::to_string(limits.maxBytes) + " bytes");
  }
  Result<std::vector<std::uint8_t>> bytes = readAll(fd.get(), path, limits.maxBytes);
  if (!bytes.ok()) return bytes.error();
  Result<Value> document = vmap::read(*bytes, limits);
  if (!document.ok()) {
    return codesignError(CodesignErrorCode::Malformed,
                         path + ": " + document.error().description());
  }
  return document;
}

}  // namespace platform::codesign::internal
