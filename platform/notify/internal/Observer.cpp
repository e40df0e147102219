#include "platform/notify/internal/Observer.h"

#include <utility>

namespace platform::notify::internal {

Observer::Observer(std::string name, std::shared_ptr<dispatch::Queue> queue,
                   NotificationCallback callback)
    : name_(std::move(name)),
      queue_(std::move(queue)),
      callback_(std::make_shared<const NotificationCallback>(std::move(callback))) {}

void Observer::deliver(std::uint64_t count) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (callback_ == nullptr) return;
  }
  queue_->async([self = shared_from_this(), count] {
    std::shared_ptr<const NotificationCallback> callback;
    {
      std::lock_guard<std::mutex> lock(self->mu_);
      callback = self->callback_;
    }
    if (callback != nullptr) (*callback)(count);
  });
}

void Observer::cancel() {
  std::shared_ptr<const NotificationCallback> released;  // destroyed after the unlock
  std::lock_guard<std::mutex> lock(mu_);
  released = std::move(callback_);
}

}  // namespace platform::notify::internal
