#include "platform/locale/LinuxLocaleService.h"

#include <fcntl.h>
#include <sys/inotify.h>
#include <unistd.h>

#include <cassert>
#include <cerrno>
#include <cstdlib>
#include <cstring>
#include <mutex>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/locale/LocaleName.h"
#include "platform/root/Root.h"

namespace platform::locale {

namespace {

constexpr const char* kConfigName = "locale.conf";

std::optional<std::string> readSmallFile(const std::string& path, std::size_t limit) {
  const int fd = ::open(path.c_str(), O_RDONLY | O_CLOEXEC | O_NOFOLLOW);
  if (fd < 0) return std::nullopt;
  std::string text(limit + 1, '\0');
  std::size_t filled = 0;
  while (filled < text.size()) {
    const ssize_t n = ::read(fd, text.data() + filled, text.size() - filled);
    if (n < 0 && errno == EINTR) continue;
    if (n <= 0) break;
    filled += static_cast<std::size_t>(n);
  }
  ::close(fd);
  if (filled > limit) return std::nullopt;
  text.resize(filled);
  return text;
}

// One observation: an inotify descriptor on the configuration directory and
// the locale last reported.
struct Watch {
  int fd = -1;
  std::shared_ptr<dispatch::FdSource> source;
  std::shared_ptr<dispatch::Queue> queue;
  LocaleCallback callback;
  std::string last;  // touched only on the source's queue
};

}  // namespace

LinuxLocaleService::LinuxLocaleService()
    : LinuxLocaleService(rootPath("etc"), [] {
        const char* lang = std::getenv("LANG");
        return lang ? std::optional<std::string>(lang) : std::nullopt;
      }()) {}

LinuxLocaleService::LinuxLocaleService(std::string configDirectory,
                                       std::optional<std::string> processLang)
    : configDirectory_(std::move(configDirectory)), processLang_(std::move(processLang)) {}

std::string LinuxLocaleService::currentLocale() const {
  if (auto text = readSmallFile(configDirectory_ + "/" + kConfigName, kMaxConfigBytes)) {
    if (auto lang = langFromLocaleConf(*text)) {
      if (auto name = normalizeLocaleName(*lang)) return *name;
    }
  }
  if (processLang_) {
    if (auto name = normalizeLocaleName(*processLang_)) return *name;
  }
  return std::string(kFallbackLocale);
}

Result<notify::ObservationHandle> LinuxLocaleService::observeChanges(
    std::shared_ptr<dispatch::Queue> queue, LocaleCallback callback) {
  assert(queue != nullptr && callback != nullptr);
  auto watch = std::make_shared<Watch>();
  watch->fd = ::inotify_init1(IN_NONBLOCK | IN_CLOEXEC);
  if (watch->fd < 0) return Error::posix(errno, "inotify_init1");
  const std::uint32_t mask =
      IN_CLOSE_WRITE | IN_MOVED_TO | IN_MOVED_FROM | IN_CREATE | IN_DELETE | IN_ATTRIB;
  if (::inotify_add_watch(watch->fd, configDirectory_.c_str(), mask) < 0) {
    const int err = errno;
    ::close(watch->fd);
    return Error::posix(err, "inotify_add_watch " + configDirectory_);
  }
  watch->queue = std::move(queue);
  watch->callback = std::move(callback);
  watch->last = currentLocale();

  auto reader = dispatch::SerialQueue::create("locale.watch");
  std::weak_ptr<Watch> weak = watch;
  const LinuxLocaleService copy(configDirectory_, processLang_);
  auto source = dispatch::FdSource::create(
      "locale.conf", dispatch::Priority::Utility, watch->fd, dispatch::FdSource::Event::Readable,
      reader, [weak, copy] {
        auto self = weak.lock();
        if (!self) return;
        // Only whether something happened matters: drain, then look again.
        alignas(inotify_event) char buffer[4096];
        bool touched = false;
        for (;;) {
          const ssize_t n = ::read(self->fd, buffer, sizeof buffer);
          if (n <= 0) break;
          for (ssize_t at = 0; at < n;) {
            const auto* event = reinterpret_cast<const inotify_event*>(buffer + at);
            if (event->len > 0 && std::strcmp(event->name, kConfigName) == 0) touched = true;
            if (event->mask & IN_Q_OVERFLOW) touched = true;
            at += static_cast<ssize_t>(sizeof(inotify_event) + event->len);
          }
        }
        if (!touched) return;
        std::string now = copy.currentLocale();
        if (now == self->last) return;
        self->last = now;
        self->queue->async([callback = self->callback, now] { callback(now); });
      });
  if (!source.ok()) {
    ::close(watch->fd);
    return Error::posix(source.error(), "watching " + configDirectory_);
  }
  watch->source = std::move(source).value();
  const int fd = watch->fd;
  watch->source->setCancelHandler([fd] { ::close(fd); });
  watch->source->resume();
  return notify::ObservationHandle([watch] { watch->source->cancel(); });
}

}  // namespace platform::locale
