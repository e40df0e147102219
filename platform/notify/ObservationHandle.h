// Keeps an observation alive: destroying the handle (or cancel()) ends it.
// After cancel() returns no new callback starts; one already running on
// another thread may still finish, so an observer whose callback uses
// borrowed state should cancel on the callback's (serial) queue.
//
// Thread safety: a handle belongs to one owner; cancel() is idempotent.
#pragma once

#include <functional>
#include <utility>

namespace platform::notify {

class [[nodiscard]] ObservationHandle {
 public:
  ObservationHandle() = default;  // observes nothing
  // `cancel` runs once, at cancel() or destruction.
  explicit ObservationHandle(std::function<void()> cancel) : cancel_(std::move(cancel)) {}
  ObservationHandle(ObservationHandle&& other) noexcept : cancel_(std::move(other.cancel_)) {
    other.cancel_ = nullptr;
  }
  ObservationHandle& operator=(ObservationHandle&& other) noexcept {
    if (this != &other) {
      cancel();
      cancel_ = std::move(other.cancel_);
      other.cancel_ = nullptr;
    }
    return *this;
  }
  ObservationHandle(const ObservationHandle&) = delete;
  ObservationHandle& operator=(const ObservationHandle&) = delete;
  ~ObservationHandle() { cancel(); }

  bool isActive() const { return cancel_ != nullptr; }

  void cancel() {
    if (cancel_ == nullptr) return;
    std::function<void()> run = std::move(cancel_);
    cancel_ = nullptr;
    run();
  }

 private:
  std::function<void()> cancel_;
};

}  // namespace platform::notify
