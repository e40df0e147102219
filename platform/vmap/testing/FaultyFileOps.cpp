#include "platform/vmap/testing/FaultyFileOps.h"

#include <algorithm>

namespace platform::vmap {

void FaultyFileOps::failAt(FileStep step, int err, int occurrence, PartialWrite partial) {
  step_ = step;
  errno_ = err;
  occurrence_ = occurrence;
  partial_ = partial;
  fired_ = false;
}

int FaultyFileOps::enter(FileStep step) {
  steps_.push_back(step);
  if (errno_ == 0 || fired_ || step != step_) return 0;
  if (std::count(steps_.begin(), steps_.end(), step) != occurrence_) return 0;
  fired_ = true;
  return errno_;
}

Result<int> FaultyFileOps::openFile(const std::string& path, mode_t mode, Exclusive exclusive) {
  if (int err = enter(FileStep::OpenFile)) return Error::posix(err, "open " + path);
  return inner_.openFile(path, mode, exclusive);
}

Status FaultyFileOps::write(int fd, std::span<const std::uint8_t> bytes) {
  if (int err = enter(FileStep::Write)) {
    if (partial_ == PartialWrite::Yes) (void)inner_.write(fd, bytes.first(bytes.size() / 2));
    return Error::posix(err, "write");
  }
  return inner_.write(fd, bytes);
}

Status FaultyFileOps::fsync(int fd) {
  if (int err = enter(FileStep::Fsync)) return Error::posix(err, "fsync");
  return inner_.fsync(fd);
}

Status FaultyFileOps::fsyncDirectory(int fd) {
  if (int err = enter(FileStep::FsyncDirectory)) return Error::posix(err, "fsync of the directory");
  return inner_.fsyncDirectory(fd);
}

Status FaultyFileOps::close(int fd) {
  if (int err = enter(FileStep::Close)) {
    (void)inner_.close(fd);
    return Error::posix(err, "close");
  }
  return inner_.close(fd);
}

Status FaultyFileOps::rename(const std::string& from, const std::string& to) {
  if (int err = enter(FileStep::Rename)) return Error::posix(err, "rename " + from + " to " + to);
  return inner_.rename(from, to);
}

Status FaultyFileOps::unlink(const std::string& path) {
  if (int err = enter(FileStep::Unlink)) return Error::posix(err, "unlink " + path);
  return inner_.unlink(path);
}

Result<int> FaultyFileOps::openDirectory(const std::string& path) {
  if (int err = enter(FileStep::OpenDirectory)) return Error::posix(err, "open directory " + path);
  return inner_.openDirectory(path);
}

}  // namespace platform::vmap
