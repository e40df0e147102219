#include "platform/lumend/testing/FakeServiceManager.h"

#include <errno.h>

#include <utility>

namespace platform::lumend {

void FakeServiceManager::setAdditionResult(int error) {
  std::lock_guard<std::mutex> lock(mu_);
  additionResult_ = error;
}

void FakeServiceManager::setRemovalResult(const std::string& bundleIdentifier, int error) {
  std::lock_guard<std::mutex> lock(mu_);
  removalResults_[bundleIdentifier] = error;
}

void FakeServiceManager::holdReplies() {
  std::lock_guard<std::mutex> lock(mu_);
  holding_ = true;
}

std::size_t FakeServiceManager::releaseReplies() {
  std::vector<Pending> held;
  {
    std::lock_guard<std::mutex> lock(mu_);
    holding_ = false;
    held.swap(held_);
  }
  for (Pending& pending : held) send(std::move(pending));
  return held.size();
}

int FakeServiceManager::addExternalService(int hostPid, const std::string& executablePath,
                                           const Dictionary& overlay) {
  std::lock_guard<std::mutex> lock(mu_);
  additions_.push_back({hostPid, executablePath, overlay});
  return additionResult_;
}

void FakeServiceManager::removeExternalService(const std::string& bundleIdentifier,
                                               const std::string& version,
                                               std::shared_ptr<dispatch::Queue> queue,
                                               RemovalReply reply) {
  Pending pending{std::move(queue), std::move(reply), ESRCH};
  {
    std::lock_guard<std::mutex> lock(mu_);
    removals_.push_back({bundleIdentifier, version});
    if (auto found = removalResults_.find(bundleIdentifier); found != removalResults_.end()) {
      pending.error = found->second;
    }
    if (holding_) {
      held_.push_back(std::move(pending));
      return;
    }
  }
  send(std::move(pending));
}

void FakeServiceManager::send(Pending pending) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    ++sent_;
  }
  pending.queue->async([reply = std::move(pending.reply), error = pending.error] { reply(error); });
}

std::vector<FakeServiceManager::Addition> FakeServiceManager::additions() const {
  std::lock_guard<std::mutex> lock(mu_);
  return additions_;
}

std::vector<FakeServiceManager::Removal> FakeServiceManager::removals() const {
  std::lock_guard<std::mutex> lock(mu_);
  return removals_;
}

std::size_t FakeServiceManager::repliesSent() const {
  std::lock_guard<std::mutex> lock(mu_);
  return sent_;
}

}  // namespace platform::lumend
