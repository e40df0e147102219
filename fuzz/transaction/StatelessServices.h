// Platform services for a daemon that serves millions of requests in one
// process: unlike the test fakes they record nothing, so memory stays flat.
// Their answers are fixed by the name they are asked about, so that every
// branch of a caller can still be reached:
//  - service manager: additions succeed; removals answer 0 for
//    "com.example.alpha", EPERM for "com.example.gamma", else ESRCH;
//  - sandbox extensions: tokens as "fuzz;file;<path>", EACCES for a path
//    holding "denied";
//  - assertions: "com.example.busy" has one busy instance;
//  - consents: "com.example.host" was granted the keyboard network;
//  - containers: <base>/<uid>/<identifier>, refusing what the real one does.
//
// Thread safety: all are safe from any thread (they keep no mutable state).
#pragma once

#include <memory>
#include <string>

#include "platform/container/ContainerManager.h"
#include "platform/lumend/ServiceManager.h"
#include "platform/pvg/ConsentService.h"
#include "platform/sandbox/SandboxExtensions.h"
#include "platform/vouchd/AssertionService.h"

namespace qvd::fuzzing {

class StatelessServiceManager final : public platform::lumend::ServiceManager {
 public:
  int addExternalService(int hostPid, const std::string& executablePath,
                         const platform::Dictionary& overlay) override;
  void removeExternalService(const std::string& bundleIdentifier, const std::string& version,
                             std::shared_ptr<platform::dispatch::Queue> queue,
                             platform::lumend::RemovalReply reply) override;
};

class StatelessSandboxExtensions final : public platform::sandbox::SandboxExtensions {
 public:
  platform::Result<std::string> issueFileExtension(
      std::string_view path, platform::sandbox::PathResolution resolution) const override;
  platform::Result<std::string> issueServiceExtension(std::string_view extensionClass,
                                                      std::string_view serviceName) const override;
  // The daemon only issues; taking up a token is refused.
  platform::Result<std::int64_t> consume(std::string_view token) override;
  platform::Status release(std::int64_t handle) override;
};

class StatelessAssertionService final : public platform::vouchd::AssertionService {
 public:
  platform::Result<std::vector<platform::vouchd::ExtensionInstance>> busyExtensionInstances(
      const std::set<std::string>& bundleIdentifiers) const override;
};

class StatelessConsentService final : public platform::pvg::ConsentService {
 public:
  platform::Result<std::vector<platform::pvg::ConsentRecord>> consentRecordsForBundle(
      const platform::bundle::Bundle& bundle) const override;
};

class StatelessContainerManager final : public platform::container::ContainerManager {
 public:
  explicit StatelessContainerManager(std::string base) : base_(std::move(base)) {}
  platform::Result<std::string> userContainer(uid_t uid, std::string_view identifier) override;

 private:
  const std::string base_;
};

}  // namespace qvd::fuzzing
