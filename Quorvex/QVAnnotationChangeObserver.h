// Watches the "com.corvane.quorvex.annotation-change" notification the
// daemon posts after annotation and hold changes, and runs a callback with
// the notification's count each time it changes. Rapid posts may arrive as
// one callback; the last count is always delivered.
//
//   auto observer = QVAnnotationChangeObserver::start(center, queue,
//                                                     [](std::uint64_t count) { ... });
//
// Thread safety: callbacks run on the given queue. The observer belongs to
// one owner; cancel() is idempotent, and once it returns no new callback
// starts (cancel on the callback's serial queue to be sure none is running).
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <utility>

#include "platform/dispatch/Queue.h"
#include "platform/notify/NotificationCenter.h"
#include "platform/values/Result.h"

class QVAnnotationChangeObserver {
 public:
  using Callback = std::function<void(std::uint64_t count)>;

  // Fails when the center refuses to observe (its error, unchanged).
  // REQUIRES: center, queue and callback are not null.
  static platform::Result<std::unique_ptr<QVAnnotationChangeObserver>> start(
      std::shared_ptr<platform::notify::NotificationCenter> center,
      std::shared_ptr<platform::dispatch::Queue> queue, Callback callback);

  // Stops observing.
  ~QVAnnotationChangeObserver() = default;
  QVAnnotationChangeObserver(const QVAnnotationChangeObserver&) = delete;
  QVAnnotationChangeObserver& operator=(const QVAnnotationChangeObserver&) = delete;

  void cancel() { handle_.cancel(); }
  bool isActive() const { return handle_.isActive(); }

 private:
  QVAnnotationChangeObserver(std::shared_ptr<platform::notify::NotificationCenter> center,
                             platform::notify::ObservationHandle handle)
      : center_(std::move(center)), handle_(std::move(handle)) {}

  // Held because destroying a center ends the observations made through it.
  // Declared first so that the handle is cancelled before the center goes.
  std::shared_ptr<platform::notify::NotificationCenter> center_;
  platform::notify::ObservationHandle handle_;
};
