#include "bench/registry/SyntheticRoot.h"

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <memory>

#include "platform/values/Value.h"
#include "platform/vmap/Writer.h"

namespace bench::registry {
namespace {

using platform::Array;
using platform::Dictionary;
using platform::Error;
using platform::Result;
using platform::Status;
using platform::Value;

Status makeDirectory(const std::string& path) {
  if (::mkdir(path.c_str(), 0755) == 0 || errno == EEXIST) return platform::okStatus();
  return Error::posix(errno, "mkdir " + path);
}

Status makeDirectories(const std::string& root, std::string_view relative) {
  std::string path = root;
  std::size_t start = 0;
  while (start < relative.size()) {
    std::size_t end = relative.find('/', start);
    if (end == std::string_view::npos) end = relative.size();
    path += "/";
    path += relative.substr(start, end - start);
    if (Status made = makeDirectory(path); !made.ok()) return made;
    start = end + 1;
  }
  return platform::okStatus();
}

// Plain writes: the root is scratch, so there is nothing to gain from the
// atomic replacement (and its two fsyncs per file) the daemon uses.
Status writeVmap(const std::string& path, const Value& value) {
  Result<std::string> text = platform::vmap::write(value, platform::vmap::Format::Xml);
  if (!text.ok()) return text.error();
  const int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
  if (fd < 0) return Error::posix(errno, "open " + path);
  const ssize_t written = ::write(fd, text->data(), text->size());
  const int err = errno;
  ::close(fd);
  if (written != static_cast<ssize_t>(text->size())) {
    return Error::posix(written < 0 ? err : EIO, "write " + path);
  }
  return platform::okStatus();
}

// About the size of a real widget's Info.vmap: names, versions, a protocol
// list and a handful of attributes the host selects on. No PrincipalClass:
// an ".ovx" bundle is an application extension, which may not name one.
Dictionary plugInInfo(std::size_t index, const std::string& point) {
  char number[16];
  std::snprintf(number, sizeof number, "%05zu", index);
  Dictionary attributes{{"XOExtensionVersion", "1.0"},
                        {"Kind", "bench"},
                        {"Index", static_cast<std::int64_t>(index)},
                        {"Families", Array{"circular", "corner", "rectangular"}},
                        {"RefreshIntervalSeconds", 900},
                        {"SupportsAlwaysOn", index % 2 == 0}};
  Dictionary extension{{"XOExtensionPointIdentifier", point},
                       {"XOExtensionProtocol", Array{"QVBenchProvider", "QVTimelineProvider"}},
                       {"HubProtocolVersion", 2},
                       {"XOExtensionAttributes", std::move(attributes)}};
  return Dictionary{{"BXBundleIdentifier", "com.corvane.bench.plugin" + std::string(number)},
                    {"BXBundleName", "Bench" + std::string(number)},
                    {"BXBundleDisplayName", "Bench plug-in " + std::string(number)},
                    {"BXBundleShortVersionString", "1.0"},
                    {"BXBundleVersion", std::to_string(100 + index % 7)},
                    {"BXExecutable", "Bench"},
                    {"XOExtension", std::move(extension)}};
}

// What an extension point adds to each of its plug-ins.
Dictionary sdkInfo() {
  return Dictionary{
      {"XOExtension", Dictionary{{"XOExtensionSDKVersion", 3},
                                 {"CleanTimeout", 30},
                                 {"XOExtensionAttributes", Dictionary{{"SDKDeclared", true}}}}}};
}

}  // namespace

std::string SyntheticRoot::pointName(std::size_t index) {
  std::string letters;
  do {
    letters.insert(letters.begin(), static_cast<char>('a' + index % 26));
    index /= 26;
  } while (index > 0);
  return "com.corvane.bench.point." + letters;
}

Result<SyntheticRoot> SyntheticRoot::make(std::string directory, std::size_t plugIns,
                                          std::size_t points) {
  if (points == 0 || plugIns % points != 0) {
    return Error::posix(EINVAL, "plug-ins must spread evenly over the extension points");
  }
  if (::mkdir(directory.c_str(), 0755) != 0) return Error::posix(errno, "mkdir " + directory);
  // The registry compares canonical bundle paths with the root's, so the
  // root itself must be canonical.
  std::unique_ptr<char, decltype(&::free)> resolved(::realpath(directory.c_str(), nullptr),
                                                    &::free);
  if (!resolved) return Error::posix(errno, "realpath " + directory);
  SyntheticRoot root(resolved.get(), plugIns, points);

  const std::string pointsDirectory = root.path_ + "/System/Library/ExtensionPoints";
  const std::string plugInsDirectory = root.path_ + "/System/Library/PlugIns";
  for (std::string_view relative :
       {"System/Library/ExtensionPoints", "System/Library/PlugIns", "etc", "var"}) {
    if (Status made = makeDirectories(root.path_, relative); !made.ok()) return made.error();
  }
  const Value sdk(sdkInfo());
  for (std::size_t p = 0; p < points; ++p) {
    if (Status written = writeVmap(pointsDirectory + "/" + pointName(p) + ".vmap", sdk);
        !written.ok()) {
      return written.error();
    }
  }
  const Value entitlements(Dictionary{{"com.corvane.bench.entitlement", true}});
  const std::size_t perPoint = plugIns / points;
  for (std::size_t i = 0; i < plugIns; ++i) {
    const std::string point = pointName(i / perPoint);
    const std::string bundle = plugInsDirectory + "/" + point + "-" + std::to_string(i) + ".ovx";
    if (Status made = makeDirectory(bundle); !made.ok()) return made.error();
    if (Status written = writeVmap(bundle + "/Info.vmap", Value(plugInInfo(i, point)));
        !written.ok()) {
      return written.error();
    }
    if (i % 10 == 0) {
      if (Status written = writeVmap(bundle + "/Entitlements.vmap", entitlements); !written.ok()) {
        return written.error();
      }
    }
  }
  return root;
}

}  // namespace bench::registry
