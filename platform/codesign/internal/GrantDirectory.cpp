#include "platform/codesign/internal/GrantDirectory.h"

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <utility>

#include "platform/codesign/CodesignError.h"
#include "platform/codesign/internal/CanonicalPath.h"
#include "platform/codesign/internal/CodesignLog.h"
#include "platform/codesign/internal/ScopedFd.h"
#include "platform/codesign/internal/TrustedDocument.h"

namespace platform::codesign::internal {
namespace {

constexpr std::string_view kSuffix = ".vmap";

// Hidden files are editors' and atomic writers' temporaries, never grants.
bool isGrantFileName(std::string_view name) {
  return name.size() > kSuffix.size() && name.front() != '.' &&
         name.substr(name.size() - kSuffix.size()) == kSuffix;
}

}  // namespace

GrantDirectory::GrantDirectory(std::string directory, uid_t daemonUid, std::size_t maxFiles,
                               const vmap::ReadLimits& fileLimits)
    : directory_(std::move(directory)),
      daemonUid_(daemonUid),
      maxFiles_(maxFiles),
      fileLimits_(fileLimits) {}

Status GrantDirectory::refresh() {
  ScopedFd directoryFd(::open(directory_.c_str(), O_RDONLY | O_DIRECTORY | O_CLOEXEC));
  if (!directoryFd.valid()) {
    const int err = errno;
    if (err == ENOENT) {
      clear();
      noteFailure(std::nullopt);
      return okStatus();
    }
    Error failure = err == ENOTDIR ? codesignError(CodesignErrorCode::NotADirectory,
                                                   directory_ + ": not a directory")
                                   : Error::posix(err, "open " + directory_);
    clear();
    noteFailure(failure);
    return failure;
  }
  Result<std::vector<std::string>> names = listNames(directoryFd.get());
  if (!names.ok()) {
    clear();
    noteFailure(names.error());
    return names.error();
  }
  noteFailure(std::nullopt);

  bool changed = false;
  std::map<std::string, FileEntry> next;
  for (const std::string& name : *names) {
    struct stat status {};
    if (::fstatat(directoryFd.get(), name.c_str(), &status, AT_SYMLINK_NOFOLLOW) != 0) {
      continue;  // removed since the listing: it no longer grants anything
    }
    const FileSignature seen = FileSignature::of(status);
    auto cached = files_.find(name);
    if (cached != files_.end() && cached->second.signature == seen && !cached->second.recent) {
      next.emplace(name, std::move(cached->second));
      continue;
    }
    FileEntry entry = readFile(directoryFd.get(), name, seen);
    const bool sameOutcomeAsBefore = cached != files_.end() &&
                                     cached->second.signature == entry.signature &&
                                     cached->second.ignoredBecause == entry.ignoredBecause;
    if (!entry.grant.has_value() && !sameOutcomeAsBefore) {
      codesignLog().error("ignoring grant file %{public}s: %{public}s", directory_ + "/" + name,
                          entry.ignoredBecause);
    }
    next.emplace(name, std::move(entry));
    changed = true;
  }
  if (next.size() != files_.size()) changed = true;  // some file went away
  files_ = std::move(next);
  if (changed) rebuildMerged();
  return okStatus();
}

const Dictionary* GrantDirectory::entitlementsOf(const std::string& canonicalExecutable) const {
  auto found = merged_.find(canonicalExecutable);
  return found == merged_.end() ? nullptr : &found->second;
}

Result<std::vector<std::string>> GrantDirectory::listNames(int directoryFd) const {
  // fdopendir takes over the descriptor it is given, so it gets its own.
  const int listingFd = ::dup(directoryFd);
  if (listingFd < 0) return Error::posix(errno, "dup " + directory_);
  DIR* listing = ::fdopendir(listingFd);
  if (listing == nullptr) {
    const int err = errno;
    ::close(listingFd);
    return Error::posix(err, "fdopendir " + directory_);
  }
  std::vector<std::string> names;
  for (;;) {
    errno = 0;
    const struct dirent* item = ::readdir(listing);
    if (item == nullptr) break;
    if (!isGrantFileName(item->d_name)) continue;
    if (names.size() == maxFiles_) {
      ::closedir(listing);
      return codesignError(
          CodesignErrorCode::TooManyGrantFiles,
          directory_ + ": more than " + std::to_string(maxFiles_) + " grant files");
    }
    names.emplace_back(item->d_name);
  }
  const int err = errno;
  ::closedir(listing);
  if (err != 0) return Error::posix(err, "readdir " + directory_);
  return names;
}

GrantDirectory::FileEntry GrantDirectory::readFile(int directoryFd, const std::string& name,
                                                   const FileSignature& seen) {
  ++reads_;
  FileEntry entry;
  entry.signature = seen;
  Result<Value> document = readTrustedDocument(directoryFd, name, directory_ + "/" + name,
                                               daemonUid_, fileLimits_, &entry.signature);
  entry.recent = entry.signature.isRecent();
  if (!document.ok()) {
    entry.ignoredBecause = document.error().description();
    return entry;
  }
  const Dictionary* grant = document->dictionary();
  const std::string* executable = grant != nullptr ? grant->get("executable").string() : nullptr;
  const Dictionary* entitlements =
      grant != nullptr ? grant->get("entitlements").dictionary() : nullptr;
  if (grant == nullptr) {
    entry.ignoredBecause = "not a dictionary";
  } else if (executable == nullptr || executable->empty() || executable->front() != '/' ||
             executable->size() >= PATH_MAX) {
    entry.ignoredBecause = "\"executable\" is not an absolute path";
  } else if (entitlements == nullptr) {
    entry.ignoredBecause = "\"entitlements\" is not a dictionary";
  } else {
    entry.grant = Grant{canonicalPath(*executable), *entitlements};
  }
  return entry;
}

void GrantDirectory::rebuildMerged() {
  merged_.clear();
  for (const auto& [name, entry] : files_) {
    if (!entry.grant.has_value()) continue;
    Dictionary& into = merged_[entry.grant->executable];
    for (const auto& [key, value] : entry.grant->entitlements) into.set(key, value);
  }
}

void GrantDirectory::clear() {
  files_.clear();
  merged_.clear();
}

void GrantDirectory::noteFailure(const std::optional<Error>& failure) {
  if (!failure.has_value()) {
    lastFailure_.clear();
    return;
  }
  std::string text = failure->description();
  if (text == lastFailure_) return;
  codesignLog().error("granting nothing: %{public}s", text);
  lastFailure_ = std::move(text);
}

}  // namespace platform::codesign::internal
