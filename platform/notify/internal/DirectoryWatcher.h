// Watches the counter directory with one inotify descriptor, read by an
// FdSource on the watcher's own serial queue, and tells each observer of a
// name when that name's count changes. All events of one wakeup are
// coalesced per name; the count is read after the events, so the last post
// before a quiet moment is always delivered.
//
// Thread safety: add() and remove() are safe from any thread; everything
// else runs on the watcher's queue.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <set>
#include <string>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/notify/internal/Observer.h"
#include "platform/values/Result.h"

namespace platform::notify::internal {

class DirectoryWatcher : public std::enable_shared_from_this<DirectoryWatcher> {
 public:
  // Creates `directory` when missing and starts watching it.
  // REQUIRES: directory is absolute.
  static Result<std::shared_ptr<DirectoryWatcher>> start(std::string directory);
  ~DirectoryWatcher();
  DirectoryWatcher(const DirectoryWatcher&) = delete;
  DirectoryWatcher& operator=(const DirectoryWatcher&) = delete;

  // Registers `observer`, its baseline being the count now. Waits for the
  // watcher's queue.
  Status add(const std::shared_ptr<Observer>& observer);
  // Forgets `observer` (later, on the watcher's queue).
  void remove(const std::shared_ptr<Observer>& observer);
  // Cancels every observer and stops watching. Waits for the watcher's queue.
  void stop();

 private:
  DirectoryWatcher(std::string directory, int inotifyFd);
  // Adds (again) the inotify watch on the directory.
  Status watchDirectory();
  void onReadable();
  // Reads `name`'s count and delivers it to observers that have not seen it.
  void refresh(const std::string& name);
  void refreshAll();

  const std::string directory_;
  const int inotifyFd_;  // closed by the source's cancel handler
  const std::shared_ptr<dispatch::SerialQueue> queue_;
  std::shared_ptr<dispatch::FdSource> source_;
  // Confined to queue_.
  int watch_ = -1;
  std::map<std::string, std::set<std::shared_ptr<Observer>>> observers_;
};

}  // namespace platform::notify::internal
