#include "platform/lumend/internal/ProcessScan.h"

#include <dirent.h>
#include <limits.h>
#include <unistd.h>

#include <map>
#include <optional>
#include <string_view>

#include "platform/bundle/Bundle.h"
#include "platform/lumend/internal/LumendLog.h"

namespace platform::lumend::internal {

namespace {

constexpr std::string_view kDeletedSuffix = " (deleted)";

std::optional<pid_t> pidFromName(std::string_view name) {
  if (name.empty() || name.size() > 7 || name.front() == '0') return std::nullopt;
  long pid = 0;
  for (char c : name) {
    if (c < '0' || c > '9') return std::nullopt;
    pid = pid * 10 + (c - '0');
  }
  return static_cast<pid_t>(pid);
}

// The executable a /proc link names, without the mark the kernel adds for
// a file that has been removed; none when it cannot be read (a kernel
// thread, a zombie, another user's process).
std::optional<std::string> executableOf(const std::string& procDirectory, std::string_view pid) {
  const std::string link = procDirectory + "/" + std::string(pid) + "/exe";
  char target[PATH_MAX];
  const ssize_t length = ::readlink(link.c_str(), target, sizeof target);
  if (length <= 0 || static_cast<std::size_t>(length) == sizeof target) return std::nullopt;
  std::string path(target, static_cast<std::size_t>(length));
  if (path.ends_with(kDeletedSuffix)) path.resize(path.size() - kDeletedSuffix.size());
  if (path.empty() || path.front() != '/') return std::nullopt;
  return path;
}

// The identifier of the nearest bundle around `executable`, if any.
std::optional<std::string> bundleIdentifierAround(const std::string& executable) {
  Result<bundle::Bundle> found =
      bundle::Bundle::create(executable, bundle::BundlePathKind::Executable);
  if (!found.ok() || found->infoDictionary() == nullptr) return std::nullopt;
  const std::string* identifier = found->infoDictionary()->get("BXBundleIdentifier").string();
  if (identifier == nullptr) return std::nullopt;
  return *identifier;
}

}  // namespace

std::vector<ProcessHandle> findInstances(const ScanRequest& request) {
  std::vector<ProcessHandle> instances;
  DIR* proc = ::opendir(request.procDirectory.c_str());
  if (proc == nullptr) {
    lumendLog().error("cannot read %{public}s: %{errno}d", request.procDirectory, errno);
    return instances;
  }
  const pid_t self = ::getpid();
  // Many processes run one executable; its bundle is read once.
  std::map<std::string, bool, std::less<>> matches;
  std::size_t seen = 0;
  while (const dirent* entry = ::readdir(proc)) {
    const std::optional<pid_t> pid = pidFromName(entry->d_name);
    if (!pid || *pid == self) continue;
    if (++seen > request.maxProcesses) {
      lumendLog().error("more than %zu processes; the rest were not looked at",
                        request.maxProcesses);
      break;
    }
    // The handle is taken before the executable is read: should the pid be
    // reused in between, the handle names the old process, which is gone,
    // and a signal through it reaches nobody.
    Result<ProcessHandle> handle = ProcessHandle::open(*pid);
    if (!handle.ok()) continue;
    const std::optional<std::string> executable =
        executableOf(request.procDirectory, entry->d_name);
    if (!executable) continue;
    auto known = matches.find(*executable);
    if (known == matches.end()) {
      const bool match = request.executables.contains(*executable) ||
                         bundleIdentifierAround(*executable) == request.bundleIdentifier;
      known = matches.emplace(*executable, match).first;
    }
    if (known->second) instances.push_back(std::move(handle).value());
  }
  ::closedir(proc);
  return instances;
}

}  // namespace platform::lumend::internal
