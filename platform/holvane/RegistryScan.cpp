#include "platform/holvane/RegistryScan.h"

#include <dirent.h>
#include <errno.h>
#include <sys/stat.h>

#include <algorithm>
#include <memory>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/holvane/RegistryError.h"

namespace platform::holvane {
namespace {

struct DirCloser {
  void operator()(DIR* dir) const { ::closedir(dir); }
};

}  // namespace

RegistryScan::RegistryScan(RegistryLocations locations, ScanLimits limits)
    : locations_(std::move(locations)), limits_(limits) {}

Result<std::vector<std::string>> RegistryScan::subdirectories(const std::string& directory) const {
  dispatch::ScopedBlockingCall blocking;
  std::unique_ptr<DIR, DirCloser> dir(::opendir(directory.c_str()));
  if (!dir) return Error::posix(errno, "opendir " + directory);
  std::vector<std::string> names;
  std::size_t entries = 0;
  for (;;) {
    errno = 0;
    const dirent* entry = ::readdir(dir.get());
    if (entry == nullptr) {
      if (errno != 0) return Error::posix(errno, "readdir " + directory);
      break;
    }
    const std::string_view name = entry->d_name;
    if (name.empty() || name.front() == '.') continue;
    if (++entries > limits_.maxEntriesPerDirectory) {
      return registryError(RegistryErrorCode::TooMany,
                           directory + ": more than " +
                               std::to_string(limits_.maxEntriesPerDirectory) + " entries");
    }
    // Links to bundles count, as the registry resolves them anyway.
    struct stat status {};
    const std::string path = directory + "/" + std::string(name);
    if (::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) {
      names.emplace_back(name);
    }
  }
  std::sort(names.begin(), names.end());
  return names;
}

ScanCandidates RegistryScan::candidates() const {
  ScanCandidates found;
  auto list = [&](const std::string& directory) -> std::vector<std::string> {
    Result<std::vector<std::string>> names = subdirectories(directory);
    if (!names.ok()) {
      const Error& error = names.error();
      if (!error.is(kPosixErrorDomain, ENOENT) && !error.is(kPosixErrorDomain, ENOTDIR)) {
        found.problems.push_back(error);
      }
      return {};
    }
    return std::move(names).value();
  };
  const std::string system = locations_.systemPlugIns();
  for (const std::string& name : list(system)) found.plugInPaths.push_back(system + "/" + name);
  const std::string applications = locations_.applications();
  for (const std::string& app : list(applications)) {
    if (found.plugInPaths.size() > limits_.maxCandidates) break;  // enough to know
    if (!app.ends_with(".app")) continue;
    const std::string plugIns = applications + "/" + app + "/PlugIns";
    for (const std::string& name : list(plugIns)) found.plugInPaths.push_back(plugIns + "/" + name);
  }
  if (found.plugInPaths.size() > limits_.maxCandidates) {
    found.problems.push_back(registryError(
        RegistryErrorCode::TooMany, "more than " + std::to_string(limits_.maxCandidates) +
                                        " plug-in bundles installed; registering the first " +
                                        std::to_string(limits_.maxCandidates)));
    found.plugInPaths.resize(limits_.maxCandidates);
  }
  return found;
}

}  // namespace platform::holvane
