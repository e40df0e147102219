#include "platform/lumend/internal/ServiceRecords.h"

#include <dirent.h>
#include <errno.h>
#include <sys/stat.h>
#include <unistd.h>

#include <vector>

#include "platform/lumend/internal/LumendLog.h"
#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Reader.h"

namespace platform::lumend::internal {

namespace {

constexpr std::string_view kExecutableKey = "executable";
constexpr std::string_view kOverlayKey = "overlay";

bool isPidName(std::string_view name) {
  if (name.empty() || name.size() > 7 || name.front() == '0') return false;
  for (char c : name) {
    if (c < '0' || c > '9') return false;
  }
  return true;
}

// The host directories under `records`, at most `maxHosts` of them.
std::vector<std::string> hostDirectories(const std::string& records, std::size_t maxHosts) {
  std::vector<std::string> hosts;
  DIR* directory = ::opendir(records.c_str());
  if (directory == nullptr) return hosts;
  while (const dirent* entry = ::readdir(directory)) {
    if (!isPidName(entry->d_name)) continue;
    if (hosts.size() == maxHosts) {
      lumendLog().error("more than %zu host directories in %{public}s; the rest are ignored",
                        maxHosts, records);
      break;
    }
    hosts.push_back(records + "/" + entry->d_name);
  }
  ::closedir(directory);
  return hosts;
}

std::string recordName(const std::string& bundleIdentifier) {
  return bundleIdentifier + ".vmap";
}

}  // namespace

bool isRecordableBundleIdentifier(std::string_view identifier) {
  return !identifier.empty() && identifier.size() <= 250 && identifier.front() != '.' &&
         identifier.find('/') == std::string_view::npos &&
         identifier.find('\0') == std::string_view::npos;
}

Status writeServiceRecord(const std::string& records, int hostPid,
                          const std::string& bundleIdentifier, const std::string& executable,
                          const Dictionary& overlay) {
  const std::string host = records + "/" + std::to_string(hostPid);
  for (const std::string& directory : {records, host}) {
    if (::mkdir(directory.c_str(), 0755) != 0 && errno != EEXIST) {
      return Error::posix(errno, "mkdir " + directory);
    }
  }
  const Dictionary record{{std::string(kExecutableKey), executable},
                          {std::string(kOverlayKey), overlay}};
  return vmap::writeFileAtomically(host + "/" + recordName(bundleIdentifier), Value(record),
                                   vmap::Format::Binary);
}

std::set<std::string> recordedExecutables(const std::string& records,
                                          const std::string& bundleIdentifier,
                                          std::size_t maxHosts) {
  std::set<std::string> executables;
  // A record is small; anything larger was not written by us.
  const vmap::ReadLimits limits{.maxBytes = 256u << 10, .maxDepth = 32, .maxItems = 10'000};
  for (const std::string& host : hostDirectories(records, maxHosts)) {
    const std::string path = host + "/" + recordName(bundleIdentifier);
    Result<Value> record = vmap::readFile(path, limits);
    if (!record.ok()) continue;  // most hosts never used this plug-in
    const Dictionary* fields = record->dictionary();
    const std::string* executable = fields ? fields->get(kExecutableKey).string() : nullptr;
    if (executable != nullptr && !executable->empty() && executable->front() == '/') {
      executables.insert(*executable);
    }
  }
  return executables;
}

std::size_t dropServiceRecords(const std::string& records, const std::string& bundleIdentifier,
                               std::size_t maxHosts) {
  std::size_t dropped = 0;
  for (const std::string& host : hostDirectories(records, maxHosts)) {
    const std::string path = host + "/" + recordName(bundleIdentifier);
    if (::unlink(path.c_str()) == 0) {
      ++dropped;
      ::rmdir(host.c_str());  // fails, harmlessly, while other records remain
    } else if (errno != ENOENT) {
      lumendLog().error("cannot remove %{public}s: %{errno}d", path, errno);
    }
  }
  return dropped;
}

}  // namespace platform::lumend::internal
