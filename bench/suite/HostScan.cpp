#include "bench/suite/HostScan.h"

#include <dirent.h>
#include <errno.h>

#include <string_view>

#include "platform/vmap/Reader.h"

namespace bench::suite {

platform::Result<std::size_t> scanForPoint(const std::string& root, const std::string& point) {
  const std::string directory = root + "/System/Library/PlugIns";
  DIR* dir = ::opendir(directory.c_str());
  if (dir == nullptr) return platform::Error::posix(errno, "opendir " + directory);
  std::size_t found = 0;
  while (dirent* entry = ::readdir(dir)) {
    const std::string_view name = entry->d_name;
    if (name.size() < 4 || name.substr(name.size() - 4) != ".ovx") continue;
    platform::Result<platform::Value> info =
        platform::vmap::readFile(directory + "/" + std::string(name) + "/Info.vmap");
    if (!info.ok()) {
      ::closedir(dir);
      return info.error();
    }
    const platform::Dictionary* top = info->dictionary();
    const platform::Dictionary* extension =
        top ? top->get("XOExtension").dictionary() : nullptr;
    const std::string* named =
        extension ? extension->get("XOExtensionPointIdentifier").string() : nullptr;
    if (named != nullptr && *named == point) ++found;
  }
  ::closedir(dir);
  return found;
}

}  // namespace bench::suite
