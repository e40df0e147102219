// The platform services the daemon reaches, handed to the server at
// construction as one bundle so that tests can replace any of them with a
// fake. The daemon never reaches a platform service through a global.
//
// Thread safety: a plain value; the services it holds are safe to call from
// any thread.
#pragma once

#include <memory>

#include "platform/codesign/EntitlementStore.h"
#include "platform/container/ContainerManager.h"
#include "platform/holvane/Registry.h"
#include "platform/locale/LocaleService.h"
#include "platform/lumend/ServiceManager.h"
#include "platform/notify/NotificationCenter.h"
#include "platform/prefs/PreferenceStore.h"
#include "platform/pvg/ConsentService.h"
#include "platform/sandbox/SandboxCheck.h"
#include "platform/sandbox/SandboxExtensions.h"
#include "platform/types/TypeRegistry.h"
#include "platform/values/Result.h"
#include "platform/vouchd/AssertionService.h"

namespace qvd {

struct Platform {
  std::shared_ptr<const platform::codesign::EntitlementStore> entitlements;
  std::shared_ptr<const platform::sandbox::SandboxCheck> sandbox;
  std::shared_ptr<const platform::prefs::PreferenceStore> preferences;
  std::shared_ptr<platform::notify::NotificationCenter> notifications;
  std::shared_ptr<platform::container::ContainerManager> containers;
  // Which plug-ins are installed: the database's source of truth.
  std::shared_ptr<platform::holvane::Registry> registry;
  std::shared_ptr<platform::locale::LocaleService> locale;
  std::shared_ptr<platform::sandbox::SandboxExtensions> extensions;
  // Type conformance and activation rules, for match rules.
  std::shared_ptr<const platform::types::TypeRegistry> types;
  // The service manager (lumend): ends the processes of held and
  // uninstalled plug-ins.
  std::shared_ptr<platform::lumend::ServiceManager> serviceManager;
  // The process-assertion service (vouchd): which plug-ins are busy.
  std::shared_ptr<const platform::vouchd::AssertionService> assertions;
  // The privacy-consent service (pvg): what applications were granted.
  std::shared_ptr<const platform::pvg::ConsentService> consents;

  // The Linux implementations, all under the platform root; the registry
  // has registered what is installed before this returns. Fails when this
  // process's own identity (which the sandbox check compares peers with)
  // cannot be taken, or when no registration database can be made.
  static platform::Result<Platform> linuxPlatform();

  // True when every service is present.
  bool complete() const {
    return entitlements && sandbox && preferences && notifications && containers && registry &&
           locale && extensions && types && serviceManager && assertions && consents;
  }
};

}  // namespace qvd
