#include "platform/notify/testing/FakeNotificationCenter.h"

#include <algorithm>
#include <cassert>
#include <utility>

#include "platform/notify/internal/NotifyName.h"

namespace platform::notify {

Status FakeNotificationCenter::post(std::string_view name) {
  if (auto refused = internal::refuseName(name)) return *refused;
  std::uint64_t count;
  std::vector<Observation> observers;
  {
    std::lock_guard<std::mutex> lock(state_->mu);
    auto found = state_->counts.find(name);
    if (found == state_->counts.end()) found = state_->counts.emplace(std::string(name), 0).first;
    count = ++found->second;
    if (auto watching = state_->observers.find(name); watching != state_->observers.end()) {
      observers = watching->second;
    }
  }
  for (const Observation& observer : observers) {
    // Skipped when cancelled since the list was copied, as the real center does.
    auto call = [state = state_, key = std::string(name), id = observer.id,
                 callback = observer.callback, count] {
      {
        std::lock_guard<std::mutex> lock(state->mu);
        auto found = state->observers.find(key);
        if (found == state->observers.end() ||
            std::none_of(found->second.begin(), found->second.end(),
                         [id](const Observation& o) { return o.id == id; })) {
          return;
        }
      }
      (*callback)(count);
    };
    if (observer.queue->isCurrent()) {
      call();
    } else {
      observer.queue->sync(call);
    }
  }
  return okStatus();
}

Result<std::uint64_t> FakeNotificationCenter::currentCount(std::string_view name) const {
  if (auto refused = internal::refuseName(name)) return *refused;
  std::lock_guard<std::mutex> lock(state_->mu);
  auto found = state_->counts.find(name);
  return found == state_->counts.end() ? std::uint64_t{0} : found->second;
}

Result<ObservationHandle> FakeNotificationCenter::observe(std::string_view name,
                                                          std::shared_ptr<dispatch::Queue> queue,
                                                          NotificationCallback callback) {
  assert(queue != nullptr && callback != nullptr);
  if (auto refused = internal::refuseName(name)) return *refused;
  std::lock_guard<std::mutex> lock(state_->mu);
  const std::uint64_t id = state_->nextId++;
  state_->observers[std::string(name)].push_back(Observation{
      id, std::move(queue), std::make_shared<const NotificationCallback>(std::move(callback))});
  std::weak_ptr<State> weak = state_;
  return ObservationHandle([weak, key = std::string(name), id] {
    auto state = weak.lock();
    if (state == nullptr) return;
    std::lock_guard<std::mutex> lock(state->mu);
    auto found = state->observers.find(key);
    if (found == state->observers.end()) return;
    std::erase_if(found->second, [id](const Observation& o) { return o.id == id; });
    if (found->second.empty()) state->observers.erase(found);
  });
}

std::size_t FakeNotificationCenter::observerCountForTesting(std::string_view name) const {
  std::lock_guard<std::mutex> lock(state_->mu);
  auto found = state_->observers.find(name);
  return found == state_->observers.end() ? 0 : found->second.size();
}

}  // namespace platform::notify
