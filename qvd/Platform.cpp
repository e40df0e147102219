#include "qvd/Platform.h"

#include "platform/codesign/LinuxEntitlementStore.h"
#include "platform/container/LinuxContainerManager.h"
#include "platform/notify/LinuxNotificationCenter.h"
#include "platform/prefs/LinuxPreferenceStore.h"
#include "platform/sandbox/LinuxSandboxCheck.h"

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
  return services;
}

}  // namespace qvd
