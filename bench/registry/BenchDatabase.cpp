#include "bench/registry/BenchDatabase.h"

#include <unistd.h>

#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/holvane/LinuxSdkRegistry.h"
#include "platform/locale/LinuxLocaleService.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"

namespace bench::registry {

using platform::holvane::LinuxRegistry;

platform::Result<std::shared_ptr<LinuxRegistry>> openRegistry(const std::string& root) {
  auto sdks = std::make_shared<platform::holvane::LinuxSdkRegistry>(
      root + "/System/Library/ExtensionPoints");
  auto entitlements = std::make_shared<platform::codesign::LinuxEntitlementStore>(
      root + "/etc/quorvex/entitlements", ::geteuid());
  return LinuxRegistry::open(platform::holvane::RegistryLocations{root}, std::move(sdks),
                             std::move(entitlements), platform::holvane::StartupScan::Run);
}

platform::Result<std::unique_ptr<BenchDatabase>> BenchDatabase::open(
    std::shared_ptr<platform::holvane::Registry> registry, const std::string& root) {
  std::unique_ptr<BenchDatabase> database(new BenchDatabase());
  qvd::Platform& services = database->services_;
  services.registry = std::move(registry);
  services.locale =
      std::make_shared<platform::locale::LinuxLocaleService>(root + "/etc", std::nullopt);
  services.containers =
      std::make_shared<platform::container::LinuxContainerManager>(root + "/var/containers/User");
  services.notifications =
      std::make_shared<platform::notify::LinuxNotificationCenter>(root + "/run/quorvex/notify");
  services.extensions = std::make_shared<platform::sandbox::LinuxSandboxExtensions>(
      root + "/run/quorvex/sandbox/key");
  if (platform::Status made =
          database->initDatabase(root + "/var/db/Quorvex-Annotations", services);
      !made.ok()) {
    return made.error();
  }
  return database;
}

}  // namespace bench::registry
