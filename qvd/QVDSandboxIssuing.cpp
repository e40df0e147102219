#include "qvd/QVDSandboxIssuing.h"

#include <limits.h>
#include <stdlib.h>

#include <algorithm>
#include <cerrno>
#include <optional>
#include <vector>

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVSandboxExtensionConstants.h"
#include "platform/values/Array.h"

namespace qvd {
namespace {

using platform::Error;
using platform::Result;
using platform::sandbox::SandboxExtensions;

constexpr std::string_view kWholeBundle = ".";

Result<std::string> issueForPath(const SandboxExtensions& extensions, const std::string& path) {
  Result<std::string> token =
      extensions.issueFileExtension(path, platform::sandbox::PathResolution::Canonicalise);
  if (token.ok()) QVLogSandbox().debug("issued file extension for %s -> %s", path, *token);
  return token;
}

// An entry names something inside the bundle: something other than slashes,
// and without a ".." component that would climb out of it.
bool staysInsideBundle(std::string_view entry) {
  if (entry.find_first_not_of('/') == std::string_view::npos) return false;
  std::size_t start = 0;
  while (start <= entry.size()) {
    const std::size_t end = std::min(entry.find('/', start), entry.size());
    if (entry.substr(start, end - start) == "..") return false;
    start = end + 1;
  }
  return true;
}

// Appending a component joins with exactly one separator, as URLs do: "/x"
// appended to the bundle names the bundle's "x".
std::string appendComponent(std::string_view directory, std::string_view component) {
  std::string path(directory);
  if (path.empty() || path.back() != '/') path.push_back('/');
  const std::size_t start = component.find_first_not_of('/');
  if (start != std::string_view::npos) path.append(component.substr(start));
  return path;
}

// The string entries of `entries`, in order: a lone string is a list of one.
std::vector<const std::string*> stringEntries(const platform::Value& entries) {
  std::vector<const std::string*> strings;
  if (const std::string* single = entries.string()) {
    strings.push_back(single);
  } else if (const platform::Array* list = entries.array()) {
    for (const platform::Value& element : *list) {
      if (const std::string* entry = element.string()) strings.push_back(entry);
    }
  }
  return strings;
}

// Whether `path`, with its links resolved, still lies in the bundle: a
// plug-in could otherwise link a shared entry to any file the daemon can
// read and have hosts handed tokens for it. A path that cannot be resolved
// is left to the issuer, which refuses it.
bool resolvesInsideBundle(const std::string& path, const std::string& bundlePath) {
  char resolved[PATH_MAX];
  char bundle[PATH_MAX];
  if (::realpath(path.c_str(), resolved) == nullptr) return true;
  if (::realpath(bundlePath.c_str(), bundle) == nullptr) return false;
  const std::string_view inside(resolved);
  const std::string_view root(bundle);
  return inside == root || (inside.size() > root.size() && inside.substr(0, root.size()) == root &&
                            (root == "/" || inside[root.size()] == '/'));
}

void logFailure(std::string_view path, std::string_view bundlePath, int err) {
  QVLogOps().info("failed to make extension for %@ in plug-in at %@: %{public}s", path, bundlePath,
                  Error::posix(err).description());
}

}  // namespace

Result<std::string> issueFileExtension(const SandboxExtensions& extensions,
                                       std::string_view fileURL) {
  std::optional<std::string> path = QVPathFromFileURL(fileURL);
  if (!path) return Error::posix(EINVAL, "not a file URL");
  return issueForPath(extensions, *path);
}

Result<std::string> issueServiceExtension(const SandboxExtensions& extensions,
                                          std::string_view serviceName) {
  Result<std::string> token =
      extensions.issueServiceExtension(QVServiceExtensionClass, serviceName);
  if (token.ok()) {
    QVLogSandbox().debug("issued mach extension for %s -> %s", serviceName, *token);
  }
  return token;
}

platform::Dictionary issueResourceExtensions(const SandboxExtensions& extensions,
                                             const platform::Value& entries,
                                             std::string_view bundleURL,
                                             std::optional<std::string>* wholeBundle) {
  platform::Dictionary tokens;
  const std::optional<std::string> bundlePath = QVPathFromFileURL(bundleURL);
  // For the log only: a bundle URL that is no file URL is named as given.
  const std::string bundleName = bundlePath ? *bundlePath : std::string(bundleURL);
  std::vector<const std::string*> wanted = stringEntries(entries);
  if (wanted.size() > kMaxResourceExtensionEntries) {
    QVLogOps().info("ignoring %zu shared resource entries past the first %zu in plug-in at %@",
                    wanted.size() - kMaxResourceExtensionEntries, kMaxResourceExtensionEntries,
                    bundleName);
    wanted.resize(kMaxResourceExtensionEntries);
  }
  for (const std::string* entry : wanted) {
    const bool whole = *entry == kWholeBundle;
    const std::string path = !bundlePath ? *entry
                             : whole     ? *bundlePath
                                         : appendComponent(*bundlePath, *entry);
    if (!bundlePath ||
        (!whole && (!staysInsideBundle(*entry) || !resolvesInsideBundle(path, *bundlePath)))) {
      logFailure(path, bundleName, EINVAL);
      continue;
    }
    if (whole && wholeBundle != nullptr && wholeBundle->has_value()) {
      tokens.set(*entry, platform::Value(**wholeBundle));
      continue;
    }
    Result<std::string> token = issueForPath(extensions, path);
    if (!token.ok()) {
      logFailure(path, bundleName, platform::sandbox::sandboxErrno(token.error()));
      continue;
    }
    if (whole && wholeBundle != nullptr) *wholeBundle = *token;
    tokens.set(*entry, platform::Value(std::move(token).value()));
  }
  return tokens;
}

}  // namespace qvd
