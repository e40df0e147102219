#include "platform/sandbox/internal/HandleTable.h"

#include <cerrno>
#include <string>
#include <utility>

namespace platform::sandbox::internal {

HandleTable& HandleTable::shared() {
  static HandleTable* table = new HandleTable();
  return *table;
}

Result<std::int64_t> HandleTable::add(ExtensionGrant grant) {
  std::lock_guard<std::mutex> lock(mu_);
  if (live_.size() >= kMaxLiveHandles) {
    return Error::posix(EMFILE, "sandbox extensions: " + std::to_string(kMaxLiveHandles) +
                                    " consumed and not released");
  }
  const std::int64_t handle = next_++;
  live_.emplace(handle, std::move(grant));
  return handle;
}

Status HandleTable::remove(std::int64_t handle) {
  std::lock_guard<std::mutex> lock(mu_);
  if (live_.erase(handle) == 0) {
    return Error::posix(EBADF, "sandbox extension handle " + std::to_string(handle));
  }
  return okStatus();
}

std::optional<ExtensionGrant> HandleTable::find(std::int64_t handle) const {
  std::lock_guard<std::mutex> lock(mu_);
  auto found = live_.find(handle);
  if (found == live_.end()) return std::nullopt;
  return found->second;
}

std::size_t HandleTable::size() const {
  std::lock_guard<std::mutex> lock(mu_);
  return live_.size();
}

}  // namespace platform::sandbox::internal
