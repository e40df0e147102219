#include "platform/prefs/internal/DomainFile.h"

#include <errno.h>
#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <utility>

#include "platform/log/LoggerRegistry.h"

namespace platform::prefs::internal {
namespace {

constexpr std::int64_t kRecentNs = 2'000'000'000;

std::int64_t nanoseconds(const struct timespec& t) {
  return static_cast<std::int64_t>(t.tv_sec) * 1'000'000'000 + t.tv_nsec;
}

const log::Logger& prefsLog() {
  static const log::Logger& logger = log::platformLog("prefs");
  return logger;
}

}  // namespace

DomainFile::DomainFile(std::string path, const vmap::ReadLimits& limits)
    : path_(std::move(path)), limits_(limits) {}

DomainFile::Signature DomainFile::signatureOf(const struct stat& status) {
  return Signature{status.st_dev, status.st_ino, status.st_size, nanoseconds(status.st_mtim),
                   nanoseconds(status.st_ctim)};
}

bool DomainFile::isRecent(const Signature& signature) {
  struct timespec now {};
  ::clock_gettime(CLOCK_REALTIME, &now);
  const std::int64_t latest = std::max(signature.mtimeNs, signature.ctimeNs);
  return nanoseconds(now) - latest < kRecentNs;
}

const Value& DomainFile::current() {
  struct stat status {};
  if (::stat(path_.c_str(), &status) != 0) {
    const int err = errno;
    cached_ = false;
    value_ = Value();
    // A missing file is the usual way to have no preferences: not a fault.
    note(err == ENOENT ? std::string() : Error::posix(err, "stat " + path_).description());
    return value_;
  }
  const Signature seen = signatureOf(status);
  if (!cached_ || recent_ || !(seen == signature_)) read(seen);
  return value_;
}

void DomainFile::read(const Signature& seen) {
  ++reads_;
  const bool sameFile = cached_ && seen == signature_;
  Result<Value> document = vmap::readFile(path_, limits_);
  // Signature of the file as it is after the read: if it moved during the
  // read, the contents may be of either version, so the next question reads
  // again.
  struct stat after {};
  const bool steady = ::stat(path_.c_str(), &after) == 0 && signatureOf(after) == seen;
  cached_ = true;
  signature_ = seen;
  recent_ = !steady || isRecent(seen);
  if (!document.ok()) {
    value_ = Value();
    if (!sameFile) lastNoted_.clear();  // a changed file reports its fault afresh
    note(document.error().description());
  } else if (document->dictionary() == nullptr) {
    value_ = Value();
    if (!sameFile) lastNoted_.clear();
    note(path_ + ": not a dictionary");
  } else {
    value_ = std::move(document).value();
    note("");
  }
}

void DomainFile::note(const std::string& problem) {
  if (problem == lastNoted_) return;
  lastNoted_ = problem;
  if (!problem.empty()) prefsLog().error("ignoring preferences: %{public}s", problem);
}

}  // namespace platform::prefs::internal
