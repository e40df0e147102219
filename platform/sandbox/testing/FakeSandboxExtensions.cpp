#include "platform/sandbox/testing/FakeSandboxExtensions.h"

#include <cerrno>
#include <utility>

namespace platform::sandbox {
namespace {

constexpr std::string_view kFakePrefix = "fake;";

}  // namespace

void FakeSandboxExtensions::setFailure(ExtensionOperation operation, int err) {
  std::lock_guard<std::mutex> lock(mu_);
  if (err == 0) {
    failures_.erase(operation);
  } else {
    failures_.insert_or_assign(operation, err);
  }
}

void FakeSandboxExtensions::failPath(std::string path, int err) {
  std::lock_guard<std::mutex> lock(mu_);
  pathFailures_.insert_or_assign(std::move(path), err);
}

std::optional<Error> FakeSandboxExtensions::failureLocked(ExtensionOperation operation) const {
  auto found = failures_.find(operation);
  if (found == failures_.end()) return std::nullopt;
  return Error::posix(found->second, "fake sandbox extensions");
}

Result<std::string> FakeSandboxExtensions::issueFileExtension(std::string_view path,
                                                              PathResolution resolution) const {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto failure = failureLocked(ExtensionOperation::IssueFile)) return *failure;
  if (auto found = pathFailures_.find(std::string(path)); found != pathFailures_.end()) {
    return Error::posix(found->second, "fake sandbox extensions: " + found->first);
  }
  if (path.empty() || path.front() != '/') return Error::posix(EINVAL, "fake: relative path");
  issued_.push_back(Issued{ExtensionOperation::IssueFile,
                           std::string(kReadOnlyFileExtensionClass), std::string(path),
                           resolution});
  return std::string(kFakePrefix) + "file;" + std::string(path);
}

Result<std::string> FakeSandboxExtensions::issueServiceExtension(
    std::string_view extensionClass, std::string_view serviceName) const {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto failure = failureLocked(ExtensionOperation::IssueService)) return *failure;
  issued_.push_back(Issued{ExtensionOperation::IssueService, std::string(extensionClass),
                           std::string(serviceName), PathResolution::AsGiven});
  return std::string(kFakePrefix) + "service;" + std::string(extensionClass) + ";" +
         std::string(serviceName);
}

Result<std::int64_t> FakeSandboxExtensions::consume(std::string_view token) {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto failure = failureLocked(ExtensionOperation::Consume)) return *failure;
  if (token.substr(0, kFakePrefix.size()) != kFakePrefix) {
    return Error::posix(EINVAL, "fake: not a fake token");
  }
  consumed_.emplace_back(token);
  live_.insert(next_);
  return next_++;
}

Status FakeSandboxExtensions::release(std::int64_t handle) {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto failure = failureLocked(ExtensionOperation::Release)) return *failure;
  if (live_.erase(handle) == 0) return Error::posix(EBADF, "fake: unknown handle");
  released_.push_back(handle);
  return okStatus();
}

std::vector<FakeSandboxExtensions::Issued> FakeSandboxExtensions::issued() const {
  std::lock_guard<std::mutex> lock(mu_);
  return issued_;
}

std::vector<std::string> FakeSandboxExtensions::consumed() const {
  std::lock_guard<std::mutex> lock(mu_);
  return consumed_;
}

std::vector<std::int64_t> FakeSandboxExtensions::released() const {
  std::lock_guard<std::mutex> lock(mu_);
  return released_;
}

std::set<std::int64_t> FakeSandboxExtensions::liveHandles() const {
  std::lock_guard<std::mutex> lock(mu_);
  return live_;
}

}  // namespace platform::sandbox
