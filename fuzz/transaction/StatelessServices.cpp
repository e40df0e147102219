#include "fuzz/transaction/StatelessServices.h"

#include <cerrno>

#include "platform/container/internal/Identifier.h"

namespace qvd::fuzzing {

int StatelessServiceManager::addExternalService(int, const std::string&,
                                                const platform::Dictionary&) {
  return 0;
}

void StatelessServiceManager::removeExternalService(const std::string& bundleIdentifier,
                                                    const std::string&,
                                                    std::shared_ptr<platform::dispatch::Queue> queue,
                                                    platform::lumend::RemovalReply reply) {
  int error = ESRCH;
  if (bundleIdentifier == "com.example.alpha") error = 0;
  if (bundleIdentifier == "com.example.gamma") error = EPERM;
  // Answered later, on the caller's queue, as the real manager does.
  queue->async([reply = std::move(reply), error] { reply(error); });
}

platform::Result<std::string> StatelessSandboxExtensions::issueFileExtension(
    std::string_view path, platform::sandbox::PathResolution) const {
  if (path.empty() || path.front() != '/') return platform::Error::posix(EINVAL, "relative path");
  if (path.find("denied") != std::string_view::npos) {
    return platform::Error::posix(EACCES, "refused for the fuzzer");
  }
  return "fuzz;file;" + std::string(path);
}

platform::Result<std::string> StatelessSandboxExtensions::issueServiceExtension(
    std::string_view extensionClass, std::string_view serviceName) const {
  return "fuzz;service;" + std::string(extensionClass) + ";" + std::string(serviceName);
}

platform::Result<std::int64_t> StatelessSandboxExtensions::consume(std::string_view) {
  return platform::Error::posix(EPERM, "the fuzzer's daemon takes up no token");
}

platform::Status StatelessSandboxExtensions::release(std::int64_t) {
  return platform::Error::posix(EBADF, "the fuzzer's daemon holds no token");
}

platform::Result<std::vector<platform::vouchd::ExtensionInstance>>
StatelessAssertionService::busyExtensionInstances(
    const std::set<std::string>& bundleIdentifiers) const {
  std::vector<platform::vouchd::ExtensionInstance> busy;
  if (bundleIdentifiers.contains("com.example.busy")) {
    busy.push_back({.pid = 4242,
                    .properties = platform::Dictionary{
                        {std::string(platform::vouchd::kInstanceBundleIdentifierKey),
                         "com.example.busy"},
                        {std::string(platform::vouchd::kInstancePidKey), 4242}}});
  }
  return busy;
}

platform::Result<std::vector<platform::pvg::ConsentRecord>>
StatelessConsentService::consentRecordsForBundle(const platform::bundle::Bundle& bundle) const {
  const std::optional<std::string> identifier = platform::pvg::consentBundleIdentifier(bundle);
  if (!identifier) {
    return platform::Error(std::string(platform::pvg::kConsentErrorDomain),
                           static_cast<std::int64_t>(platform::pvg::ConsentErrorCode::NoBundleIdentifier),
                           "bundle has no bundle identifier");
  }
  if (*identifier != "com.example.host") return std::vector<platform::pvg::ConsentRecord>();
  return std::vector<platform::pvg::ConsentRecord>{
      {.service = std::string(platform::pvg::kPVGServiceKeyboardNetwork), .granted = true}};
}

platform::Result<std::string> StatelessContainerManager::userContainer(
    uid_t uid, std::string_view identifier) {
  if (auto refused = platform::container::internal::refuseIdentifier(identifier)) return *refused;
  return base_ + "/" + std::to_string(uid) + "/" + std::string(identifier);
}

}  // namespace qvd::fuzzing
