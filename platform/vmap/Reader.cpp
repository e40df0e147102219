#include "platform/vmap/Reader.h"

#include <fcntl.h>
#include <sys/stat.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <vector>

#include "platform/vmap/Format.h"
#include "platform/vmap/internal/BinaryForm.h"
#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/XmlReader.h"

namespace platform::vmap {
namespace {

Error tooLarge(std::uint64_t size, std::size_t limit, const char* qualifier) {
  return internal::errorPlain(ErrorCode::TooLarge, std::string("document is ") + qualifier +
                                                       std::to_string(size) +
                                                       " bytes; the limit is " +
                                                       std::to_string(limit));
}

// Owns a file descriptor and closes it.
// Thread safety: a plain owner; not shared.
class Descriptor {
 public:
  explicit Descriptor(int fd) : fd_(fd) {}
  ~Descriptor() { ::close(fd_); }
  Descriptor(const Descriptor&) = delete;
  Descriptor& operator=(const Descriptor&) = delete;
  int get() const { return fd_; }

 private:
  int fd_;
};

// The whole file, refusing anything but a regular file and anything larger
// than the limit, by its size before reading and by what arrives while
// reading (the file may grow, and some files report no size at all).
Result<std::vector<std::uint8_t>> slurp(const std::string& path, std::size_t maxBytes) {
  // O_NONBLOCK: opening a FIFO must not wait for a writer before fstat can
  // refuse it. It changes nothing for regular files.
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOCTTY | O_NONBLOCK);
  if (fd < 0) return Error::posix(errno, path);
  Descriptor file(fd);
  struct stat st;
  if (::fstat(fd, &st) != 0) return Error::posix(errno, path);
  if (!S_ISREG(st.st_mode))
    return internal::withPath(internal::errorPlain(ErrorCode::NotARegularFile, "not a regular file"),
                              path);
  const auto size = static_cast<std::uint64_t>(st.st_size);
  if (size > maxBytes) return internal::withPath(tooLarge(size, maxBytes, ""), path);

  std::vector<std::uint8_t> bytes(static_cast<std::size_t>(size) + 1);
  std::size_t filled = 0;
  for (;;) {
    if (filled == bytes.size()) {
      if (bytes.size() > maxBytes)
        return internal::withPath(tooLarge(filled, maxBytes, "at least "), path);
      bytes.resize(std::min(bytes.size() * 2, maxBytes + 1));
    }
    const ssize_t n = ::read(fd, bytes.data() + filled, bytes.size() - filled);
    if (n < 0) {
      if (errno == EINTR) continue;
      return Error::posix(errno, path);
    }
    if (n == 0) break;
    filled += static_cast<std::size_t>(n);
  }
  bytes.resize(filled);
  return bytes;
}

}  // namespace

Result<Value> read(std::span<const std::uint8_t> bytes, const ReadLimits& limits) {
  if (bytes.size() > limits.maxBytes) return tooLarge(bytes.size(), limits.maxBytes, "");
  const std::optional<Format> format = detectFormat(bytes);
  if (!format)
    return internal::errorPlain(ErrorCode::NotAVmapDocument,
                                "not a vmap document: it opens with neither '<' (the XML form) "
                                "nor \"vmapbin1\" (the binary form)");
  if (*format == Format::Binary) return internal::readBinary(bytes, limits);
  return internal::readXml(bytes, limits);
}

Result<Value> readFile(const std::string& path, const ReadLimits& limits) {
  if (path.empty() || path.front() != '/')
    return internal::withPath(internal::errorPlain(ErrorCode::InvalidArgument, "path is not absolute"),
                              path);
  Result<std::vector<std::uint8_t>> bytes = slurp(path, limits.maxBytes);
  if (!bytes.ok()) return bytes.error();
  Result<Value> value = read(*bytes, limits);
  if (!value.ok()) return internal::withPath(value.error(), path);
  return value;
}

}  // namespace platform::vmap
