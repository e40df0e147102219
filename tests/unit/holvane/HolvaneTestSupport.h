// Helpers for the registration-service tests: a system root per test (all
// under one process-wide platform root, see testRoot()), writing bundles
// into it, and opening a registry over it.
#pragma once

#include <gtest/gtest.h>
#include <stdlib.h>
#include <unistd.h>

#include <atomic>
#include <cstdlib>
#include <filesystem>
#include <fstream>
#include <memory>
#include <string>

#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/holvane/LinuxRegistry.h"
#include "platform/holvane/LinuxSdkRegistry.h"
#include "platform/root/Root.h"
#include "platform/values/Value.h"
#include "platform/vmap/AtomicFile.h"

namespace platform::holvane::testing {

// The platform root is process-wide, so it is set once; each test works in
// a fresh directory below it. Removed when the process ends.
inline const std::string& processRoot() {
  struct Directory {
    std::string path;
    bool made = false;  // never remove a directory this process did not make
    ~Directory() {
      std::error_code ignored;
      if (made) std::filesystem::remove_all(path, ignored);
    }
  };
  static const Directory root = [] {
    char pattern[] = "/tmp/qv-holvane-XXXXXX";
    const char* made = ::mkdtemp(pattern);
    if (made == nullptr) std::abort();  // no place to work in: nothing can pass
    std::string path = std::filesystem::canonical(made).string();
    setRootDirectoryForTesting(path);
    return Directory{path, true};
  }();
  return root.path;
}

class SystemRoot {
 public:
  SystemRoot() {
    static std::atomic<int> serial{0};
    path_ = processRoot() + "/t" + std::to_string(++serial);
    std::filesystem::create_directories(path_);
  }
  ~SystemRoot() {
    std::error_code ignored;
    std::filesystem::remove_all(path_, ignored);
  }
  const std::string& path() const { return path_; }
  std::string operator/(const std::string& relative) const { return path_ + "/" + relative; }
  RegistryLocations locations() const { return RegistryLocations{path_}; }

 private:
  std::string path_;
};

inline void writeVmap(const std::string& path, const Value& value) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  Status written = vmap::writeFileAtomically(path, value, vmap::Format::Xml);
  ASSERT_TRUE(written.ok()) << written.error().description();
}

inline void writeText(const std::string& path, const std::string& text) {
  std::filesystem::create_directories(std::filesystem::path(path).parent_path());
  std::ofstream(path, std::ios::binary | std::ios::trunc) << text;
}

// The Info.vmap of a plug-in of `point` with bundle identifier `bundleId`.
inline Dictionary plugInInfo(const std::string& bundleId, const std::string& point,
                             Dictionary extras = {}) {
  Dictionary extension{{"XOExtensionPointIdentifier", point},
                       {"XOExtensionProtocol", Array{"QVWidget"}},
                       {"XOExtensionAttributes", Dictionary{{"Kind", "test"}}}};
  for (const auto& [key, value] : extras) extension.set(key, value);
  return Dictionary{{"BXBundleIdentifier", bundleId},
                    {"BXBundleShortVersionString", "1.0"},
                    {"BXExecutable", "Plug"},
                    {"XOExtension", extension}};
}

// Writes an application bundle with an executable.
inline void writeApplication(const std::string& appPath, const std::string& bundleId) {
  writeVmap(appPath + "/Info.vmap",
            Dictionary{{"BXBundleIdentifier", bundleId}, {"BXExecutable", "App"}});
  writeText(appPath + "/App", "#!/bin/sh\n");
}

struct RegistryUnderTest {
  std::shared_ptr<LinuxSdkRegistry> sdks;
  std::shared_ptr<codesign::LinuxEntitlementStore> entitlements;
  std::shared_ptr<LinuxRegistry> registry;
};

// For tests in which opening may fail: the failure is answered, not reported.
inline Result<RegistryUnderTest> tryOpenRegistry(const SystemRoot& root,
                                                 StartupScan scan = StartupScan::Skip,
                                                 ScanLimits limits = {}) {
  RegistryUnderTest made;
  made.sdks = std::make_shared<LinuxSdkRegistry>(root / "System/Library/ExtensionPoints");
  made.entitlements = std::make_shared<codesign::LinuxEntitlementStore>(
      root / "etc/quorvex/entitlements", ::geteuid());
  Result<std::shared_ptr<LinuxRegistry>> opened =
      LinuxRegistry::open(root.locations(), made.sdks, made.entitlements, scan, limits);
  if (!opened.ok()) return opened.error();
  made.registry = *opened;
  return made;
}

inline RegistryUnderTest openRegistry(const SystemRoot& root, StartupScan scan = StartupScan::Skip,
                                      ScanLimits limits = {}) {
  Result<RegistryUnderTest> opened = tryOpenRegistry(root, scan, limits);
  EXPECT_TRUE(opened.ok()) << (opened.ok() ? "" : opened.error().description());
  return opened.ok() ? std::move(opened).value() : RegistryUnderTest{};
}

}  // namespace platform::holvane::testing
