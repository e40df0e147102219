#include "platform/codesign/internal/FileSignature.h"

#include <time.h>

namespace platform::codesign::internal {
namespace {

// Far above any file-clock tick, and cheap: it only costs re-reading files
// that changed in the last two seconds.
constexpr std::int64_t kRecentNs = 2'000'000'000;

std::int64_t nanoseconds(const struct timespec& t) {
  return static_cast<std::int64_t>(t.tv_sec) * 1'000'000'000 + t.tv_nsec;
}

}  // namespace

FileSignature FileSignature::of(const struct stat& status) {
  FileSignature s;
  s.device = status.st_dev;
  s.inode = status.st_ino;
  s.size = status.st_size;
  s.mtimeNs = nanoseconds(status.st_mtim);
  s.ctimeNs = nanoseconds(status.st_ctim);
  s.mode = status.st_mode;
  s.owner = status.st_uid;
  return s;
}

bool FileSignature::isRecent() const {
  struct timespec now {};
  ::clock_gettime(CLOCK_REALTIME, &now);
  const std::int64_t latest = mtimeNs > ctimeNs ? mtimeNs : ctimeNs;
  return nanoseconds(now) - latest < kRecentNs;  // a future time counts as recent
}

}  // namespace platform::codesign::internal
