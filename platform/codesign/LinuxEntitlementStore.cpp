#include "platform/codesign/LinuxEntitlementStore.h"

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>

#include "platform/codesign/CodesignError.h"
#include "platform/codesign/internal/CanonicalPath.h"
#include "platform/codesign/internal/CodesignLog.h"
#include "platform/codesign/internal/TrustedDocument.h"
#include "platform/root/Root.h"

namespace platform::codesign {
namespace {

std::optional<Error> invalidPath(std::string_view path, const char* what) {
  if (!path.empty() && path.front() == '/' && path.size() < PATH_MAX &&
      path.find('\0') == std::string_view::npos) {
    return std::nullopt;
  }
  return codesignError(
      CodesignErrorCode::InvalidPath,
      std::string(what) + " is not an absolute path: \"" + std::string(path) + "\"");
}

}  // namespace

LinuxEntitlementStore::LinuxEntitlementStore()
    : LinuxEntitlementStore(rootPath("etc/quorvex/entitlements"), ::geteuid()) {}

LinuxEntitlementStore::LinuxEntitlementStore(std::string grantsDirectory, uid_t daemonUid,
                                             EntitlementLimits limits)
    : daemonUid_(daemonUid),
      limits_(limits),
      grants_(std::move(grantsDirectory), daemonUid, limits.maxGrantFiles, limits.file) {}

Result<Dictionary> LinuxEntitlementStore::entitlementsOfExecutable(
    std::string_view executablePath) const {
  if (auto invalid = invalidPath(executablePath, "executable")) return *invalid;
  const std::string canonical = internal::canonicalPath(executablePath);
  std::lock_guard<std::mutex> lock(mu_);
  if (Status refreshed = grants_.refresh(); !refreshed.ok()) return refreshed.error();
  const Dictionary* granted = grants_.entitlementsOf(canonical);
  return granted != nullptr ? *granted : Dictionary();
}

Result<Dictionary> LinuxEntitlementStore::entitlementsOfBundle(std::string_view bundlePath) const {
  if (auto invalid = invalidPath(bundlePath, "bundle")) return *invalid;
  const std::string path(bundlePath);
  char resolved[PATH_MAX];
  if (::realpath(path.c_str(), resolved) == nullptr) return Error::posix(errno, "realpath " + path);
  struct stat status {};
  if (::stat(resolved, &status) != 0) return Error::posix(errno, std::string("stat ") + resolved);
  if (!S_ISDIR(status.st_mode)) {
    return codesignError(CodesignErrorCode::NotADirectory,
                         std::string(resolved) + ": not a directory");
  }
  const std::string file = std::string(resolved) + "/Entitlements.vmap";
  Result<Value> document =
      internal::readTrustedDocument(AT_FDCWD, file, file, daemonUid_, limits_.file);
  if (!document.ok()) {
    const Error& error = document.error();
    if (!error.is(kPosixErrorDomain, ENOENT)) {
      internal::codesignLog().error("ignoring bundle entitlements %{public}s", error.description());
    }
    return Dictionary();
  }
  if (const Dictionary* declared = document->dictionary()) return *declared;
  internal::codesignLog().error("ignoring bundle entitlements %{public}s: not a dictionary", file);
  return Dictionary();
}

std::size_t LinuxEntitlementStore::grantFileReadsForTesting() const {
  std::lock_guard<std::mutex> lock(mu_);
  return grants_.readsForTesting();
}

}  // namespace platform::codesign
