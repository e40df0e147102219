#include "platform/sandbox/LinuxSandboxExtensions.h"

#include <fcntl.h>
#include <limits.h>
#include <unistd.h>

#include <cerrno>
#include <cstdio>
#include <cstdlib>
#include <memory>
#include <utility>

#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "platform/sandbox/internal/HandleTable.h"
#include "platform/sandbox/internal/SigningKeyFile.h"

#include "platform/sandbox/internal/SandboxLog.h"

namespace platform::sandbox {
namespace {

using internal::sandboxLog;

// The path with every link resolved, as realpath() gives it. One open and
// the kernel's own name for the file cost three system calls where
// realpath() makes one per component, and every plug-in form carries a
// token for its bundle. realpath() remains for a system without /proc.
Result<std::string> canonicalPath(const std::string& path) {
  const int fd = ::open(path.c_str(), O_PATH | O_CLOEXEC);
  if (fd < 0) return Error::posix(errno, "realpath " + path);
  char link[32];
  std::snprintf(link, sizeof link, "/proc/self/fd/%d", fd);
  char target[PATH_MAX];
  const ssize_t length = ::readlink(link, target, sizeof target);
  ::close(fd);
  // A name the kernel marks as no longer reachable (" (deleted)") or one
  // that fills the buffer is left to realpath(), which refuses the first.
  if (length > 0 && length < static_cast<ssize_t>(sizeof target) && target[0] == '/') {
    const std::string_view name(target, static_cast<std::size_t>(length));
    if (!name.ends_with(" (deleted)")) return std::string(name);
  }
  std::unique_ptr<char, decltype(&std::free)> resolved(::realpath(path.c_str(), nullptr),
                                                        &std::free);
  if (!resolved) return Error::posix(errno, "realpath " + path);
  return std::string(resolved.get());
}

}  // namespace

LinuxSandboxExtensions::LinuxSandboxExtensions()
    : LinuxSandboxExtensions(rootPath(kSigningKeyRelativePath)) {}

LinuxSandboxExtensions::LinuxSandboxExtensions(std::string keyPath)
    : keyPath_(std::move(keyPath)) {}

Result<std::string> LinuxSandboxExtensions::issueFileExtension(std::string_view path,
                                                               PathResolution resolution) const {
  // Checked before realpath sees the path, so that an over-long or relative
  // path gets the same answer whether or not it exists.
  if (path.empty() || path.front() != '/') {
    return Error::posix(EINVAL, "file extension: path is not absolute");
  }
  if (path.find('\0') != std::string_view::npos) {
    return Error::posix(EINVAL, "file extension: NUL in path");
  }
  if (path.size() > kMaxSubjectBytes) {
    return Error::posix(ENAMETOOLONG, "file extension: path too long");
  }
  ExtensionGrant grant{std::string(kReadOnlyFileExtensionClass), ExtensionKind::File,
                       std::string(path)};
  if (resolution == PathResolution::Canonicalise) {
    Result<std::string> canonical = canonicalPath(grant.subject);
    if (!canonical.ok()) return canonical.error();
    grant.subject = std::move(canonical).value();
  }
  return issue(grant);
}

Result<std::string> LinuxSandboxExtensions::issueServiceExtension(
    std::string_view extensionClass, std::string_view serviceName) const {
  return issue(ExtensionGrant{std::string(extensionClass), ExtensionKind::Service,
                              std::string(serviceName)});
}

Result<std::string> LinuxSandboxExtensions::issue(const ExtensionGrant& grant) const {
  Result<std::string> body = tokenBody(grant);
  if (!body.ok()) return body.error();
  Result<TokenSigner> key = signer();
  if (!key.ok()) return key.error();
  return key->signedToken(*body);
}

Result<std::int64_t> LinuxSandboxExtensions::consume(std::string_view token) {
  // The form is checked first: a malformed token never reaches the key file.
  Result<ParsedToken> parsed = parseToken(token);
  if (!parsed.ok()) return parsed.error();
  Result<TokenSigner> key = signer();
  if (!key.ok()) return key.error();
  if (!key->verifies(*parsed)) {
    return Error::posix(EPERM, "sandbox token: signature does not match");
  }
  return internal::HandleTable::shared().add(std::move(parsed->grant));
}

Status LinuxSandboxExtensions::release(std::int64_t handle) {
  return internal::HandleTable::shared().remove(handle);
}

std::optional<ExtensionGrant> LinuxSandboxExtensions::grantForHandle(std::int64_t handle) {
  return internal::HandleTable::shared().find(handle);
}

Result<TokenSigner> LinuxSandboxExtensions::signer() const {
  std::lock_guard<std::mutex> lock(mu_);
  if (signer_) return *signer_;
  Result<SigningKey> key = internal::loadOrCreateSigningKey(keyPath_);
  if (!key.ok()) {
    sandboxLog().error("sandbox signing key unusable: %{public}@", key.error());
    return key.error();
  }
  signer_.emplace(*key);
  return *signer_;
}

}  // namespace platform::sandbox
