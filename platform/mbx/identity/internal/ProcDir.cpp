#include "platform/mbx/identity/internal/ProcDir.h"

#include <fcntl.h>
#include <linux/magic.h>
#include <sys/stat.h>
#include <sys/vfs.h>
#include <unistd.h>

#include <cerrno>
#include <climits>
#include <string_view>

#include "platform/mbx/identity/IdentityError.h"
#include "platform/mbx/identity/internal/LabelText.h"

namespace platform::mbx::internal {
namespace {

constexpr std::string_view kDeletedMark = " (deleted)";
// attr/current is a single label, a few dozen bytes in practice.
constexpr std::size_t kLabelLimit = 4 * 1024;

}  // namespace

Result<ProcDir> ProcDir::open(pid_t pid) {
  const std::string path = "/proc/" + std::to_string(pid);
  // O_PATH: the directory only anchors the *at() calls below, nothing is
  // read from it directly.
  UniqueFd fd(::open(path.c_str(), O_PATH | O_DIRECTORY | O_CLOEXEC | O_NOFOLLOW));
  if (!fd.valid()) return Error::posix(errno, "open " + path);
  struct statfs fs {};
  if (::fstatfs(fd.get(), &fs) != 0) return Error::posix(errno, "fstatfs " + path);
  if (fs.f_type != PROC_SUPER_MAGIC) {
    return identityError(IdentityErrorCode::ProcNotMounted, path + " is not on a proc file system");
  }
  return ProcDir(pid, std::move(fd));
}

std::string ProcDir::pathOf(const char* name) const {
  return "/proc/" + std::to_string(pid_) + "/" + name;
}

Result<std::string> ProcDir::readFile(const char* name, std::size_t limit) const {
  UniqueFd file(::openat(fd_.get(), name, O_RDONLY | O_CLOEXEC | O_NOFOLLOW));
  if (!file.valid()) return Error::posix(errno, "open " + pathOf(name));
  // One byte more than the limit tells a file at the limit from a longer one.
  std::string text(limit + 1, '\0');
  std::size_t used = 0;
  while (used < text.size()) {
    const ssize_t n = ::read(file.get(), text.data() + used, text.size() - used);
    if (n < 0 && errno == EINTR) continue;
    if (n < 0) return Error::posix(errno, "read " + pathOf(name));
    if (n == 0) break;
    used += static_cast<std::size_t>(n);
  }
  if (used > limit) {
    return identityError(IdentityErrorCode::TooLong,
                         pathOf(name) + " is longer than " + std::to_string(limit) + " bytes");
  }
  text.resize(used);
  return text;
}

Result<ProcStat> ProcDir::readStat() const {
  Result<std::string> text = readFile("stat", kProcStatLimit);
  if (!text) return text.error();
  Result<ProcStat> stat = parseProcStat(*text);
  if (stat && stat->pid != pid_) {
    return identityError(IdentityErrorCode::MalformedProcFile,
                         pathOf("stat") + " names pid " + std::to_string(stat->pid));
  }
  return stat;
}

Result<ProcStatusFacts> ProcDir::readStatus() const {
  Result<std::string> text = readFile("status", kProcStatusLimit);
  if (!text) return text.error();
  return parseProcStatus(*text);
}

Result<FileKey> ProcDir::statExecutable() const {
  struct stat st {};
  // Following the link reaches the file the process runs, even a deleted one.
  if (::fstatat(fd_.get(), "exe", &st, 0) != 0) return Error::posix(errno, "stat " + pathOf("exe"));
  return FileKey{st.st_dev, st.st_ino};
}

Result<ExecutableFacts> ProcDir::readExecutable(const FileKey& running) const {
  char buffer[PATH_MAX];
  const ssize_t n = ::readlinkat(fd_.get(), "exe", buffer, sizeof buffer);
  if (n < 0) return Error::posix(errno, "readlink " + pathOf("exe"));
  // readlink truncates silently: a full buffer may be a cut path.
  if (static_cast<std::size_t>(n) >= sizeof buffer) {
    return identityError(IdentityErrorCode::TooLong, pathOf("exe") + " is PATH_MAX or longer");
  }
  ExecutableFacts facts;
  facts.path.assign(buffer, static_cast<std::size_t>(n));
  if (facts.path.empty() || facts.path.front() != '/') {
    return identityError(IdentityErrorCode::ExecutableNotAbsolute,
                         pathOf("exe") + " reads \"" + facts.path + "\"");
  }
  if (facts.path.ends_with(kDeletedMark)) {
    // The kernel appends the mark once the file's name is gone, but a file
    // may also really be called "x (deleted)": only a file of that very name
    // that is the running one keeps its name.
    struct stat st {};
    const bool named = ::fstatat(AT_FDCWD, facts.path.c_str(), &st, AT_SYMLINK_NOFOLLOW) == 0 &&
                       S_ISREG(st.st_mode) && FileKey{st.st_dev, st.st_ino} == running;
    if (!named) {
      facts.path.resize(facts.path.size() - kDeletedMark.size());
      facts.replaced = true;
    }
  }
  return facts;
}

Result<std::uint64_t> ProcDir::readMountNamespace() const {
  struct stat st {};
  if (::fstatat(fd_.get(), "ns/mnt", &st, 0) != 0) {
    return Error::posix(errno, "stat " + pathOf("ns/mnt"));
  }
  return static_cast<std::uint64_t>(st.st_ino);
}

Result<std::string> ProcDir::readSecurityLabel() const {
  Result<std::string> raw = readFile("attr/current", kLabelLimit);
  if (raw) return normalizeSecurityLabel(*raw);
  // No LSM that keeps a per-process label: there is nothing to compare.
  if (raw.error().domain() == kPosixErrorDomain &&
      (raw.error().code() == EINVAL || raw.error().code() == ENOENT ||
       raw.error().code() == EOPNOTSUPP)) {
    return std::string();
  }
  return raw.error();
}

}  // namespace platform::mbx::internal
