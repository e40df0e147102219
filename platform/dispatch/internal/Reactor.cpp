#include "platform/dispatch/internal/Reactor.h"

#include <sys/eventfd.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/dispatch/Queue.h"
#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/Thread.h"

namespace platform::dispatch::internal {
namespace {

constexpr std::uint64_t kWakeKey = 1;
constexpr std::uint64_t kTimerKey = 2;
constexpr std::uint64_t kFirstSourceKey = 16;

bool later(const auto& a, const auto& b) {
  return a.deadline != b.deadline ? a.deadline > b.deadline : a.sequence > b.sequence;
}

void drainCounter(int fd) {
  std::uint64_t value;
  while (::read(fd, &value, sizeof value) == sizeof value) {
  }
}

}  // namespace

Reactor& Reactor::instance() {
  // Never destroyed: sources may be cancelled while the process exits.
  static Reactor* const reactor = [] {
    auto* r = new Reactor();
    startDetachedThread("qv-reactor", [r] { r->threadMain(); });
    return r;
  }();
  return *reactor;
}

Reactor::Reactor() : nextKey_(kFirstSourceKey) {
  epollFd_ = epoll_create1(EPOLL_CLOEXEC);
  wakeFd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  timerFd_ = timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK);
  if (epollFd_ < 0 || wakeFd_ < 0 || timerFd_ < 0) {
    fatal("cannot set up the reactor: %s", std::strerror(errno));
  }
  if (watch(wakeFd_, kWakeKey, EPOLLIN) != 0 || watch(timerFd_, kTimerKey, EPOLLIN) != 0) {
    fatal("cannot set up the reactor: %s", std::strerror(errno));
  }
}

std::uint64_t Reactor::add(std::shared_ptr<ReadyTarget> target, Priority priority) {
  std::lock_guard<std::mutex> lock(entriesMu_);
  std::uint64_t key = nextKey_++;
  entries_.emplace(key, Entry{std::move(target), priority});
  return key;
}

void Reactor::remove(std::uint64_t key) {
  std::shared_ptr<ReadyTarget> last;  // released outside the lock
  std::lock_guard<std::mutex> lock(entriesMu_);
  auto it = entries_.find(key);
  if (it == entries_.end()) return;
  last = std::move(it->second.target);
  entries_.erase(it);
}

int Reactor::watch(int fd, std::uint64_t key, std::uint32_t events) {
  epoll_event ev{};
  ev.events = events;
  ev.data.u64 = key;
  return epoll_ctl(epollFd_, EPOLL_CTL_ADD, fd, &ev) == 0 ? 0 : errno;
}

int Reactor::modify(int fd, std::uint64_t key, std::uint32_t events) {
  epoll_event ev{};
  ev.events = events;
  ev.data.u64 = key;
  return epoll_ctl(epollFd_, EPOLL_CTL_MOD, fd, &ev) == 0 ? 0 : errno;
}

int Reactor::unwatch(int fd) {
  return epoll_ctl(epollFd_, EPOLL_CTL_DEL, fd, nullptr) == 0 ? 0 : errno;
}

void Reactor::after(std::chrono::nanoseconds delay, std::shared_ptr<Queue> queue, Closure work) {
  std::lock_guard<std::mutex> lock(timersMu_);
  auto deadline = std::chrono::steady_clock::now() + std::max(delay, std::chrono::nanoseconds(0));
  timers_.push_back(Timer{deadline, nextSequence_++, std::move(queue), std::move(work)});
  std::push_heap(timers_.begin(), timers_.end(), later<Timer, Timer>);
  // Only a new earliest deadline moves the timerfd.
  if (timers_.front().sequence == nextSequence_ - 1) armTimerFdLocked();
}

void Reactor::armTimerFdLocked() {
  itimerspec setting{};
  if (!timers_.empty()) {
    // steady_clock is CLOCK_MONOTONIC, so the deadline is an absolute time
    // on the timerfd's clock. A deadline already past fires at once.
    auto ns = std::chrono::duration_cast<std::chrono::nanoseconds>(
                  timers_.front().deadline.time_since_epoch())
                  .count();
    setting.it_value.tv_sec = ns / 1'000'000'000;
    setting.it_value.tv_nsec = ns % 1'000'000'000;
    if (setting.it_value.tv_sec == 0 && setting.it_value.tv_nsec == 0) setting.it_value.tv_nsec = 1;
  }
  timerfd_settime(timerFd_, TFD_TIMER_ABSTIME, &setting, nullptr);
}

void Reactor::fireDueTimers() {
  drainCounter(timerFd_);
  std::vector<Timer> due;
  {
    std::lock_guard<std::mutex> lock(timersMu_);
    auto now = std::chrono::steady_clock::now();
    while (!timers_.empty() && timers_.front().deadline <= now) {
      std::pop_heap(timers_.begin(), timers_.end(), later<Timer, Timer>);
      due.push_back(std::move(timers_.back()));
      timers_.pop_back();
    }
    armTimerFdLocked();
  }
  for (Timer& timer : due) timer.queue->async(std::move(timer.work));
}

void Reactor::threadMain() {
  epoll_event events[kMaxEventsPerWakeup];
  for (;;) {
    int count = epoll_wait(epollFd_, events, kMaxEventsPerWakeup, -1);
    if (count < 0) {
      if (errno == EINTR) continue;
      fatal("epoll_wait failed: %s", std::strerror(errno));
    }
    deliver(events, count);
    honourPause();
  }
}

void Reactor::deliver(const epoll_event* events, int count) {
  struct Ready {
    Priority priority;
    std::uint64_t key;
    std::shared_ptr<ReadyTarget> target;
  };
  std::vector<Ready> ready;
  ready.reserve(static_cast<std::size_t>(count));
  bool timerFired = false;
  {
    std::lock_guard<std::mutex> lock(entriesMu_);
    for (int i = 0; i < count; ++i) {
      std::uint64_t key = events[i].data.u64;
      if (key == kWakeKey) {
        drainCounter(wakeFd_);
      } else if (key == kTimerKey) {
        timerFired = true;
      } else if (auto it = entries_.find(key); it != entries_.end()) {
        ready.push_back(Ready{it->second.priority, key, it->second.target});
      }
    }
  }
  std::sort(ready.begin(), ready.end(), [](const Ready& a, const Ready& b) {
    return a.priority != b.priority ? a.priority > b.priority : a.key < b.key;
  });
  for (Ready& r : ready) r.target->onReady();
  if (timerFired) fireDueTimers();
}

void Reactor::honourPause() {
  std::unique_lock<std::mutex> lock(pauseMu_);
  if (!pauseRequested_) return;
  paused_ = true;
  pauseCv_.notify_all();
  pauseCv_.wait(lock, [this] { return !pauseRequested_; });
  paused_ = false;
}

void Reactor::pauseForTesting() {
  std::unique_lock<std::mutex> lock(pauseMu_);
  pauseRequested_ = true;
  std::uint64_t one = 1;
  if (::write(wakeFd_, &one, sizeof one) != sizeof one) fatal("cannot wake the reactor");
  pauseCv_.wait(lock, [this] { return paused_; });
}

void Reactor::resumeForTesting() {
  std::lock_guard<std::mutex> lock(pauseMu_);
  pauseRequested_ = false;
  pauseCv_.notify_all();
}

}  // namespace platform::dispatch::internal
