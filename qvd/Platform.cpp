#include "qvd/Platform.h"

#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/holvane/LinuxRegistry.h"
#include "platform/holvane/LinuxSdkRegistry.h"
#include "platform/locale/LinuxLocaleService.h"
#include "platform/lumend/LinuxServiceManager.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/prefs/LinuxPreferenceStore.h"
#include "platform/pvg/LinuxConsentService.h"
#include "platform/sandbox/LinuxSandboxCheck.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"
#include "platform/types/LinuxTypeRegistry.h"
#include "platform/vouchd/LinuxAssertionService.h"

namespace qvd {

platform::Result<Platform> Platform::linuxPlatform() {
  auto sandbox = platform::sandbox::LinuxSandboxCheck::create();
  if (!sandbox) return sandbox.error();
  Platform services;
  services.entitlements = std::make_shared<platform::codesign::LinuxEntitlementStore>();
  services.sandbox = std::shared_ptr<const platform::sandbox::SandboxCheck>(std::move(*sandbox));
  services.preferences = std::make_shared<platform::prefs::LinuxPreferenceStore>();
  services.notifications = std::make_shared<platform::notify::LinuxNotificationCenter>();
  services.containers = std::make_shared<platform::container::LinuxContainerManager>();
  // The start-up scan registers what lies in the system and application
  // locations, so that the daemon knows the plug-ins installed while it was
  // not running.
  auto registry = platform::holvane::LinuxRegistry::open(
      platform::holvane::RegistryLocations::current(),
      std::make_shared<platform::holvane::LinuxSdkRegistry>(), services.entitlements,
      platform::holvane::StartupScan::Run);
  if (!registry.ok()) return registry.error();
  services.registry = std::move(registry).value();
  services.locale = std::make_shared<platform::locale::LinuxLocaleService>();
  services.extensions = std::make_shared<platform::sandbox::LinuxSandboxExtensions>();
  // Read once here: the declarations ship with the system volume.
  services.types = std::make_shared<platform::types::LinuxTypeRegistry>();
  services.serviceManager = std::make_shared<platform::lumend::LinuxServiceManager>();
  services.assertions = std::make_shared<platform::vouchd::LinuxAssertionService>();
  services.consents = std::make_shared<platform::pvg::LinuxConsentService>();
  return services;
}

}  // namespace qvd
