#include "platform/notify/LinuxNotificationCenter.h"

#include <errno.h>

#include <cassert>
#include <utility>

#include "platform/notify/internal/CounterFile.h"
#include "platform/notify/internal/DirectoryWatcher.h"
#include "platform/notify/internal/NotifyName.h"
#include "platform/notify/internal/Observer.h"
#include "platform/root/Root.h"

namespace platform::notify {

LinuxNotificationCenter::LinuxNotificationCenter()
    : LinuxNotificationCenter(rootPath("run/quorvex/notify")) {}

LinuxNotificationCenter::LinuxNotificationCenter(std::string directory)
    : directory_(std::move(directory)) {}

LinuxNotificationCenter::~LinuxNotificationCenter() {
  if (watcher_ != nullptr) watcher_->stop();
}

Status LinuxNotificationCenter::post(std::string_view name) {
  if (auto refused = internal::refuseName(name)) return *refused;
  const std::string path = directory_ + "/" + std::string(name);
  Result<std::uint64_t> posted = internal::incrementCounter(path);
  if (!posted.ok() && posted.error().is(kPosixErrorDomain, ENOENT)) {
    // The first post on this system: make the directory and try once more.
    if (Status made = internal::makeDirectories(directory_); !made.ok()) return made;
    posted = internal::incrementCounter(path);
  }
  if (!posted.ok()) return posted.error();
  return okStatus();
}

Result<std::uint64_t> LinuxNotificationCenter::currentCount(std::string_view name) const {
  if (auto refused = internal::refuseName(name)) return *refused;
  return internal::readCounter(directory_ + "/" + std::string(name));
}

Result<ObservationHandle> LinuxNotificationCenter::observe(std::string_view name,
                                                           std::shared_ptr<dispatch::Queue> queue,
                                                           NotificationCallback callback) {
  assert(queue != nullptr && callback != nullptr);
  if (auto refused = internal::refuseName(name)) return *refused;
  Result<std::shared_ptr<internal::DirectoryWatcher>> watching = watcher();
  if (!watching.ok()) return watching.error();
  auto observer = std::make_shared<internal::Observer>(std::string(name), std::move(queue),
                                                       std::move(callback));
  if (Status added = (*watching)->add(observer); !added.ok()) return added.error();
  std::weak_ptr<internal::DirectoryWatcher> weak = *watching;
  return ObservationHandle([weak, observer] {
    observer->cancel();
    if (auto alive = weak.lock()) alive->remove(observer);
  });
}

Result<std::shared_ptr<internal::DirectoryWatcher>> LinuxNotificationCenter::watcher() {
  std::lock_guard<std::mutex> lock(mu_);
  if (watcher_ == nullptr) {
    Result<std::shared_ptr<internal::DirectoryWatcher>> started =
        internal::DirectoryWatcher::start(directory_);
    if (!started.ok()) return started.error();
    watcher_ = std::move(started).value();
  }
  return watcher_;
}

}  // namespace platform::notify
