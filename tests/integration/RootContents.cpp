#include "tests/integration/RootContents.h"

#include <cstdio>
#include <filesystem>

#include "Quorvex/QVDConstants.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/vmap/AtomicFile.h"
#include "platform/vmap/Reader.h"
#include "platform/vmap/Writer.h"

namespace qvd::integration {

using platform::Array;
using platform::Dictionary;
using platform::Value;

void writeVmapFile(const std::string& path, const Value& value) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  platform::Status written = platform::vmap::writeFileAtomically(path, value, platform::vmap::Format::Xml);
  if (!written.ok()) std::fprintf(stderr, "cannot write %s: %s\n", path.c_str(), written.error().description().c_str());
}

Value readVmapFile(const std::string& path) {
  auto read = platform::vmap::readFile(path);
  return read.ok() ? *read : Value();
}

std::string writeSystemPlugIn(const TemporaryRoot& root, const std::string& name,
                              const std::string& point, const Dictionary& entitlements) {
  const std::string bundle = root / ("System/Library/PlugIns/" + name + ".ovx");
  const Dictionary extension{{"XOExtensionPointIdentifier", point},
                             {"XOExtensionProtocol", Array{"QVWidget"}},
                             {"XOExtensionAttributes", Dictionary{{"Kind", "test"}}}};
  writeVmapFile(bundle + "/Info.vmap", Dictionary{{"BXBundleIdentifier", "com.example." + name},
                                                  {"BXBundleShortVersionString", "1.0"},
                                                  {"BXExecutable", "Plug"},
                                                  {"XOExtension", extension}});
  if (!entitlements.empty()) writeVmapFile(bundle + "/Entitlements.vmap", entitlements);
  return bundle;
}

std::uint64_t postCount(const TemporaryRoot& root, const std::string& name) {
  platform::notify::LinuxNotificationCenter center(root / "run/quorvex/notify");
  auto count = center.currentCount(name);
  return count.ok() ? *count : ~0ull;
}

std::pair<std::uint64_t, std::string> errorOf(const Value& reply) {
  const Dictionary* body = reply.dictionary();
  if (body == nullptr) return {~0ull, "no reply"};
  const std::string* text = body->get(QVDErrorKey).string();
  return {body->get(QVDErrorCodeKey).uint64().value_or(0), text ? *text : ""};
}

Finished runQvctl(const TemporaryRoot& root, std::vector<std::string> arguments,
                  const std::string& service) {
  std::vector<std::string> argv{QVCTL_PATH};
  if (!service.empty()) argv.insert(argv.end(), {"--service", service});
  argv.insert(argv.end(), arguments.begin(), arguments.end());
  return runProcess(argv, root.path());
}

}  // namespace qvd::integration
