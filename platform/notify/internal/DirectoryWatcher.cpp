#include "platform/notify/internal/DirectoryWatcher.h"

#include <errno.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <cstring>
#include <utility>

#include "platform/log/LoggerRegistry.h"
#include "platform/notify/internal/CounterFile.h"

namespace platform::notify::internal {
namespace {

// Every way a counter can come to hold another number: written in place,
// created, renamed in or out, removed.
constexpr std::uint32_t kWatchMask =
    IN_MODIFY | IN_CREATE | IN_MOVED_TO | IN_MOVED_FROM | IN_DELETE | IN_ONLYDIR;

// Reads per wakeup before yielding the queue; unread events wake it again.
constexpr int kMaxReadsPerWakeup = 16;

const log::Logger& notifyLog() {
  static const log::Logger& logger = log::platformLog("notify");
  return logger;
}

}  // namespace

Result<std::shared_ptr<DirectoryWatcher>> DirectoryWatcher::start(std::string directory) {
  if (Status made = makeDirectories(directory); !made.ok()) return made.error();
  const int fd = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  if (fd < 0) return Error::posix(errno, "inotify_init1");
  std::shared_ptr<DirectoryWatcher> watcher(new DirectoryWatcher(std::move(directory), fd));
  if (Status watched = watcher->watchDirectory(); !watched.ok()) return watched.error();
  std::weak_ptr<DirectoryWatcher> weak = watcher;
  auto source =
      dispatch::FdSource::create("notify " + watcher->directory_, dispatch::Priority::Default, fd,
                                 dispatch::FdSource::Event::Readable, watcher->queue_, [weak] {
                                   if (auto alive = weak.lock()) alive->onReadable();
                                 });
  if (!source.ok()) return Error::posix(source.error(), "watch " + watcher->directory_);
  watcher->source_ = std::move(source).value();
  watcher->source_->setCancelHandler([fd] { ::close(fd); });
  watcher->source_->resume();
  return watcher;
}

DirectoryWatcher::DirectoryWatcher(std::string directory, int inotifyFd)
    : directory_(std::move(directory)),
      inotifyFd_(inotifyFd),
      queue_(dispatch::SerialQueue::create("com.corvane.platform.notify")) {}

DirectoryWatcher::~DirectoryWatcher() {
  if (source_ != nullptr) {
    source_->cancel();  // its cancel handler closes the descriptor
  } else {
    ::close(inotifyFd_);
  }
}

Status DirectoryWatcher::add(const std::shared_ptr<Observer>& observer) {
  Status status;
  queue_->sync([&] {
    if (watch_ < 0) {
      status = watchDirectory();
      if (!status.ok()) return;
    }
    Result<std::uint64_t> count = readCounter(directory_ + "/" + observer->name());
    observer->lastCount = count.valueOr(0);
    observers_[observer->name()].insert(observer);
  });
  return status;
}

void DirectoryWatcher::remove(const std::shared_ptr<Observer>& observer) {
  queue_->async([self = shared_from_this(), observer] {
    auto found = self->observers_.find(observer->name());
    if (found == self->observers_.end()) return;
    found->second.erase(observer);
    if (found->second.empty()) self->observers_.erase(found);
  });
}

void DirectoryWatcher::stop() {
  queue_->sync([&] {
    for (const auto& [name, observers] : observers_) {
      for (const std::shared_ptr<Observer>& observer : observers) observer->cancel();
    }
    observers_.clear();
  });
  source_->cancel();
}

Status DirectoryWatcher::watchDirectory() {
  if (Status made = makeDirectories(directory_); !made.ok()) return made;
  const int watch = ::inotify_add_watch(inotifyFd_, directory_.c_str(), kWatchMask);
  if (watch < 0) return Error::posix(errno, "inotify_add_watch " + directory_);
  watch_ = watch;
  return okStatus();
}

void DirectoryWatcher::onReadable() {
  alignas(struct inotify_event) char buffer[8192];
  std::set<std::string> changed;
  bool everything = false;
  for (int round = 0; round < kMaxReadsPerWakeup; ++round) {
    const ssize_t n = ::read(inotifyFd_, buffer, sizeof buffer);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;  // EAGAIN: drained
    for (ssize_t at = 0; at < n;) {
      const auto* event = reinterpret_cast<const struct inotify_event*>(buffer + at);
      at += static_cast<ssize_t>(sizeof(struct inotify_event) + event->len);
      if ((event->mask & IN_Q_OVERFLOW) != 0) everything = true;
      if ((event->mask & IN_IGNORED) != 0) {  // the directory went away
        watch_ = -1;
        everything = true;
      }
      if (event->len == 0) continue;
      std::string name(event->name, ::strnlen(event->name, event->len));
      if (observers_.count(name) != 0) changed.insert(std::move(name));
    }
  }
  if (watch_ < 0) {
    if (Status watched = watchDirectory(); !watched.ok()) {
      notifyLog().error("notifications stopped: %{public}s", watched.error().description());
    }
  }
  if (everything) {
    refreshAll();
    return;
  }
  for (const std::string& name : changed) refresh(name);
}

void DirectoryWatcher::refresh(const std::string& name) {
  auto found = observers_.find(name);
  if (found == observers_.end()) return;
  Result<std::uint64_t> count = readCounter(directory_ + "/" + name);
  if (!count.ok()) {
    notifyLog().error("cannot read notification count: %{public}s", count.error().description());
    return;
  }
  for (const std::shared_ptr<Observer>& observer : found->second) {
    if (observer->lastCount == *count) continue;
    observer->lastCount = *count;
    observer->deliver(*count);
  }
}

void DirectoryWatcher::refreshAll() {
  for (const auto& [name, observers] : observers_) refresh(name);
}

}  // namespace platform::notify::internal
