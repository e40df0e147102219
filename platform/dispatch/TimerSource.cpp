#include "platform/dispatch/TimerSource.h"

#include <sys/timerfd.h>
#include <unistd.h>

#include <cerrno>
#include <cstdint>

#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/Reactor.h"

namespace platform::dispatch {

struct TimerSource::Clock {
  std::mutex mu;
  int fd;
  bool closed = false;  // the timerfd is closed once the source is cancelled
  Closure cancelHandler;
};

namespace {

timespec toTimespec(std::chrono::nanoseconds d) {
  auto ns = d.count();
  return timespec{static_cast<time_t>(ns / 1'000'000'000), static_cast<long>(ns % 1'000'000'000)};
}

}  // namespace

SysResult<std::shared_ptr<TimerSource>> TimerSource::create(std::string_view name,
                                                            Priority priority,
                                                            std::shared_ptr<Queue> target,
                                                            Closure handler) {
  int fd = timerfd_create(CLOCK_MONOTONIC, TFD_NONBLOCK | TFD_CLOEXEC);
  if (fd < 0) return SysResult<std::shared_ptr<TimerSource>>::failure(errno, "timerfd_create");
  auto clock = std::make_shared<Clock>();
  clock->fd = fd;

  auto onTick = [clock, handler = std::move(handler)]() mutable {
    // The fd stays open until the cancel handler, which cannot overlap a
    // tick. A read that finds nothing means the timer was re-scheduled
    // after it fired: no tick.
    std::uint64_t expirations = 0;
    if (::read(clock->fd, &expirations, sizeof expirations) == sizeof expirations) handler();
  };
  auto source = FdSource::create(name, priority, fd, FdSource::Event::Readable, std::move(target),
                                 std::move(onTick));
  if (!source.ok()) {
    ::close(fd);
    return SysResult<std::shared_ptr<TimerSource>>::failure(source.error(), "epoll_ctl");
  }
  source.value()->setCancelHandler([clock] {
    Closure userHandler;
    {
      std::lock_guard<std::mutex> lock(clock->mu);
      ::close(clock->fd);
      clock->closed = true;
      userHandler = std::move(clock->cancelHandler);
    }
    if (userHandler) userHandler();
  });
  return SysResult<std::shared_ptr<TimerSource>>::success(
      std::shared_ptr<TimerSource>(new TimerSource(std::move(clock), std::move(source).value())));
}

TimerSource::TimerSource(std::shared_ptr<Clock> clock, std::shared_ptr<FdSource> source)
    : clock_(std::move(clock)), source_(std::move(source)) {}

void TimerSource::setCancelHandler(Closure handler) {
  std::lock_guard<std::mutex> lock(clock_->mu);
  clock_->cancelHandler = std::move(handler);
}

void TimerSource::scheduleOnce(std::chrono::nanoseconds delay) {
  set(delay, std::chrono::nanoseconds(0));
}

void TimerSource::scheduleRepeating(std::chrono::nanoseconds first,
                                    std::chrono::nanoseconds interval) {
  if (interval <= std::chrono::nanoseconds(0)) {
    internal::fatal("timer '%s' scheduled to repeat with a non-positive interval", name().c_str());
  }
  set(first, interval);
}

void TimerSource::disarm() {
  std::lock_guard<std::mutex> lock(clock_->mu);
  if (clock_->closed) return;
  itimerspec setting{};
  timerfd_settime(clock_->fd, 0, &setting, nullptr);
}

void TimerSource::set(std::chrono::nanoseconds first, std::chrono::nanoseconds interval) {
  itimerspec setting{};
  // A zero it_value would disarm the timer: "now" is the next nanosecond.
  setting.it_value = toTimespec(std::max(first, std::chrono::nanoseconds(1)));
  setting.it_interval = toTimespec(interval);
  std::lock_guard<std::mutex> lock(clock_->mu);
  if (clock_->closed) return;
  timerfd_settime(clock_->fd, 0, &setting, nullptr);
}

void after(std::chrono::nanoseconds delay, std::shared_ptr<Queue> queue, Closure work) {
  internal::Reactor::instance().after(delay, std::move(queue), std::move(work));
}

}  // namespace platform::dispatch
