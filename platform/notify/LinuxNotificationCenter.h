// Notifications on Linux: the count of each name lives in the file
// <root>/run/quorvex/notify/<name> (see internal/CounterFile.h for the format
// and locking), so posts from every process add up and a count outlives the
// poster. Observers share one inotify descriptor on that directory, read on
// a serial queue of the dispatch layer; it is made at the first observe(),
// so a process that only posts holds no descriptor and starts no queue.
//
// Thread safety: safe to call from any thread.
#pragma once

#include <memory>
#include <mutex>
#include <string>

#include "platform/notify/NotificationCenter.h"

namespace platform::notify {

namespace internal {
class DirectoryWatcher;
}

class LinuxNotificationCenter final : public NotificationCenter {
 public:
  // Counters in rootPath("run/quorvex/notify").
  LinuxNotificationCenter();
  // REQUIRES: directory is absolute.
  explicit LinuxNotificationCenter(std::string directory);
  // Ends every observation made through this center.
  ~LinuxNotificationCenter() override;

  Status post(std::string_view name) override;
  Result<std::uint64_t> currentCount(std::string_view name) const override;
  Result<ObservationHandle> observe(std::string_view name, std::shared_ptr<dispatch::Queue> queue,
                                    NotificationCallback callback) override;

  const std::string& directory() const { return directory_; }

 private:
  Result<std::shared_ptr<internal::DirectoryWatcher>> watcher();

  const std::string directory_;
  std::mutex mu_;
  std::shared_ptr<internal::DirectoryWatcher> watcher_;  // guarded by mu_
};

}  // namespace platform::notify
