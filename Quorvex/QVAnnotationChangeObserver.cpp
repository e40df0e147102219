#include "Quorvex/QVAnnotationChangeObserver.h"

#include <cassert>

#include "Quorvex/QVDConstants.h"

platform::Result<std::unique_ptr<QVAnnotationChangeObserver>> QVAnnotationChangeObserver::start(
    std::shared_ptr<platform::notify::NotificationCenter> center,
    std::shared_ptr<platform::dispatch::Queue> queue, Callback callback) {
  assert(center && queue && callback);
  platform::Result<platform::notify::ObservationHandle> handle =
      center->observe(QVNotifyAnnotationChange, std::move(queue), std::move(callback));
  if (!handle.ok()) return handle.error();
  return std::unique_ptr<QVAnnotationChangeObserver>(
      new QVAnnotationChangeObserver(std::move(center), std::move(handle).value()));
}
