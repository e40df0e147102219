#include "platform/vmap/AtomicFile.h"

#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <random>

#include "platform/vmap/Writer.h"
#include "platform/vmap/internal/ErrorText.h"

namespace platform::vmap {
namespace {

// Attempts at a fresh temporary name before giving up; a clash means another
// writer picked the same random suffix, which is already unlikely once.
constexpr int kNameAttempts = 8;

std::string randomSuffix() {
  thread_local std::mt19937_64 generator{std::random_device{}() ^
                                         (static_cast<std::uint64_t>(::getpid()) << 32)};
  char buf[24];
  std::snprintf(buf, sizeof buf, "%016llx", static_cast<unsigned long long>(generator()));
  return buf;
}

// The failure as seen by the caller: the same domain and code, the target
// named first.
Error aboutTarget(const std::string& path, const Error& error) {
  return Error(error.domain(), error.code(), path + ": " + error.description());
}

}  // namespace

Status writeBytesAtomically(const std::string& path, std::span<const std::uint8_t> bytes,
                            FileOps& ops, mode_t mode) {
  const std::size_t slash = path.rfind('/');
  const std::string name = slash == std::string::npos ? path : path.substr(slash + 1);
  if (path.empty() || path.front() != '/' || name.empty() || name == "." || name == "..")
    return internal::withPath(
        internal::errorPlain(ErrorCode::InvalidArgument, "not an absolute path to a file"), path);
  const std::string directory = slash == 0 ? "/" : path.substr(0, slash);

  // A dot-file beside the target: same file system, so the rename is atomic,
  // and hidden from directory scans that skip dot-files.
  std::string temporary;
  Result<int> opened = Error(std::string(kPosixErrorDomain), EEXIST);
  for (int attempt = 0; attempt < kNameAttempts; ++attempt) {
    temporary = directory + (directory == "/" ? "." : "/.") + name + ".tmp-" + randomSuffix();
    opened = ops.openFile(temporary, mode, Exclusive::Yes);
    if (opened.ok() || opened.error().code() != EEXIST ||
        opened.error().domain() != kPosixErrorDomain)
      break;
  }
  if (!opened.ok()) return aboutTarget(path, opened.error());
  const int fd = *opened;

  // Before the rename, every failure leaves the target as it was.
  const auto abandon = [&](const Error& error) -> Status {
    (void)ops.unlink(temporary);  // the first failure is the one worth reporting
    return aboutTarget(path, error);
  };
  if (Status s = ops.write(fd, bytes); !s.ok()) {
    (void)ops.close(fd);
    return abandon(s.error());
  }
  if (Status s = ops.fsync(fd); !s.ok()) {
    (void)ops.close(fd);
    return abandon(s.error());
  }
  if (Status s = ops.close(fd); !s.ok()) return abandon(s.error());
  if (Status s = ops.rename(temporary, path); !s.ok()) return abandon(s.error());

  // The new contents are in place; make the rename itself durable.
  Result<int> dir = ops.openDirectory(directory);
  if (!dir.ok()) return aboutTarget(path, dir.error());
  Status synced = ops.fsyncDirectory(*dir);
  Status closed = ops.close(*dir);
  if (!synced.ok()) return aboutTarget(path, synced.error());
  if (!closed.ok()) return aboutTarget(path, closed.error());
  return okStatus();
}

Status writeFileAtomically(const std::string& path, const Value& value, Format format,
                           FileOps& ops, mode_t mode) {
  Result<std::string> document = write(value, format);
  if (!document.ok()) return internal::withPath(document.error(), path);
  const auto* data = reinterpret_cast<const std::uint8_t*>(document->data());
  return writeBytesAtomically(path, std::span<const std::uint8_t>(data, document->size()), ops,
                              mode);
}

}  // namespace platform::vmap
