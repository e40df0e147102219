#include "platform/container/testing/FakeContainerManager.h"

#include "platform/container/internal/Identifier.h"

namespace platform::container {

FakeContainerManager::FakeContainerManager(std::string baseDirectory)
    : base_(std::move(baseDirectory)) {}

void FakeContainerManager::setFailure(std::optional<Error> error) {
  std::lock_guard<std::mutex> lock(mu_);
  failure_ = std::move(error);
}

std::vector<std::pair<uid_t, std::string>> FakeContainerManager::requests() const {
  std::lock_guard<std::mutex> lock(mu_);
  return requests_;
}

Result<std::string> FakeContainerManager::userContainer(uid_t uid, std::string_view identifier) {
  std::lock_guard<std::mutex> lock(mu_);
  requests_.emplace_back(uid, std::string(identifier));
  if (auto refused = internal::refuseIdentifier(identifier)) return *refused;
  if (failure_.has_value()) return *failure_;
  return base_ + "/" + std::to_string(uid) + "/" + std::string(identifier);
}

}  // namespace platform::container
