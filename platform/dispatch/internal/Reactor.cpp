#include "platform/dispatch/internal/Reactor.h"

#include <sys/eventfd.h>
#include <sys/timerfd.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <cstring>

#include "platform/dispatch/Queue.h"
#include "platform/dispatch/internal/Fatal.h"
#include "platform/dispatch/internal/ThreadPool.h"

namespace platform::dispatch::internal {
namespace {

constexpr std::uint64_t kWakeKey = 1;
constexpr std::uint64_t kTimerKey = 2;
constexpr std::uint64_t kKickKey = 3;
constexpr std::uint64_t kFirstSourceKey = 16;

bool later(const auto& a, const auto& b) {
  return a.deadline != b.deadline ? a.deadline > b.deadline : a.sequence > b.sequence;
}

void drainCounter(int fd) {
  std::uint64_t value;
  while (::read(fd, &value, sizeof value) == sizeof value) {
  }
}

void bump(int fd) {
  std::uint64_t one = 1;
  if (::write(fd, &one, sizeof one) != sizeof one)
    fatal("cannot signal an eventfd: %s", std::strerror(errno));
}

}  // namespace

Reactor& Reactor::instance() {
  // Never destroyed: sources may be cancelled while the process exits.
  static Reactor* const reactor = new Reactor();
  return *reactor;
}

Reactor::Reactor() : nextKey_(kFirstSourceKey) {
  epollFd_ = epoll_create1(EPOLL_CLOEXEC);
  wakeFd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  kickFd_ = eventfd(0, EFD_CLOEXEC | EFD_NONBLOCK);
  timerFd_ = timerfd_create(CLOCK_MONOTONIC, TFD_CLOEXEC | TFD_NONBLOCK);
  if (epollFd_ < 0 || wakeFd_ < 0 || kickFd_ < 0 || timerFd_ < 0) {
    fatal("cannot set up the reactor: %s", std::strerror(errno));
  }
  // Edge-triggered wake and timer: each signal or expiry is taken by exactly
  // one waiter. The wake counter is never read back; it would take 2^64
  // signals to fill. The kick is level-triggered on purpose: while it is
  // set, every waiter returns.
  if (watch(wakeFd_, kWakeKey, EPOLLIN | EPOLLET) != 0 ||
      watch(timerFd_, kTimerKey, EPOLLIN | EPOLLET) != 0 ||
      watch(kickFd_, kKickKey, EPOLLIN) != 0) {
    fatal("cannot set up the reactor: %s", std::strerror(errno));
  }
}

std::uint64_t Reactor::add(std::shared_ptr<ReadyTarget> target, Priority priority) {
  std::uint64_t key;
  {
    std::lock_guard<std::mutex> lock(entriesMu_);
    key = nextKey_++;
    entries_.emplace(key, Entry{std::move(target), priority});
  }
  // Events are only seen by an idle pool thread: make sure there is one.
  ThreadPool::instance().keepAWaiter();
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
  {
    std::lock_guard<std::mutex> lock(timersMu_);
    auto deadline = std::chrono::steady_clock::now() + std::max(delay, std::chrono::nanoseconds(0));
    timers_.push_back(Timer{deadline, nextSequence_++, std::move(queue), std::move(work)});
    std::push_heap(timers_.begin(), timers_.end(), later<Timer, Timer>);
    // Only a new earliest deadline moves the timerfd.
    if (timers_.front().sequence == nextSequence_ - 1) armTimerFdLocked();
  }
  ThreadPool::instance().keepAWaiter();
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

void Reactor::wait(std::chrono::steady_clock::duration timeout, Harvest& out) {
  out.polled = false;
  out.woken = false;
  out.timers = false;
  out.count = 0;
  {
    std::unique_lock<std::mutex> lock(pauseMu_);
    if (pauseRequested_) {
      pauseCv_.wait(lock, [this] { return !pauseRequested_; });
      return;  // the caller looks at its work and limits again
    }
    ++activePolls_;
  }
  out.polled = true;
  auto ms = std::chrono::ceil<std::chrono::milliseconds>(timeout).count();
  int timeoutMs = static_cast<int>(std::clamp<std::int64_t>(ms, 0, 24 * 3600 * 1000));
  epoll_event events[kMaxEventsPerWakeup];
  int count = epoll_wait(epollFd_, events, kMaxEventsPerWakeup, timeoutMs);
  if (count < 0) {
    if (errno == EINTR) return;
    fatal("epoll_wait failed: %s", std::strerror(errno));
  }
  {
    std::lock_guard<std::mutex> lock(entriesMu_);
    for (int i = 0; i < count; ++i) {
      std::uint64_t key = events[i].data.u64;
      if (key == kWakeKey) {
        out.woken = true;
      } else if (key == kTimerKey) {
        out.timers = true;
      } else if (key == kKickKey) {
        // Only makes the waiter return.
      } else if (auto it = entries_.find(key); it != entries_.end()) {
        out.ready[out.count++] =
            Ready{it->second.priority, key, events[i].events, it->second.target};
      }
    }
  }
  std::sort(out.ready, out.ready + out.count, [](const Ready& a, const Ready& b) {
    return a.priority != b.priority ? a.priority > b.priority : a.key < b.key;
  });
}

Closure Reactor::deliver(Harvest& harvest, RunSlot* slot) {
  if (!harvest.polled) return Closure();
  // Every target is told before the claimed handler runs, so a long
  // handler never holds back the events that came with it.
  Closure claimed;
  for (int i = 0; i < harvest.count; ++i) {
    Ready& r = harvest.ready[i];
    Closure work = r.target->onReady(r.events, claimed ? nullptr : slot);
    if (work) claimed = std::move(work);
    r.target.reset();
  }
  harvest.count = 0;
  if (harvest.timers) fireDueTimers();
  leavePoll();
  return claimed;
}

void Reactor::leavePoll() {
  std::lock_guard<std::mutex> lock(pauseMu_);
  if (--activePolls_ == 0 && pauseRequested_) pauseCv_.notify_all();
}

void Reactor::wakeOne() {
  bump(wakeFd_);
}

void Reactor::pauseForTesting() {
  std::unique_lock<std::mutex> lock(pauseMu_);
  pauseRequested_ = true;
  // Every waiter returns while the kick is set; signalling it again now and
  // then only guards against a waiter the kernel has not woken yet.
  bump(kickFd_);
  while (!pauseCv_.wait_for(lock, std::chrono::milliseconds(5),
                            [this] { return activePolls_ == 0; })) {
    bump(kickFd_);
  }
}

int Reactor::pollingThreadsForTesting() {
  std::lock_guard<std::mutex> lock(pauseMu_);
  return activePolls_;
}

void Reactor::resumeForTesting() {
  std::lock_guard<std::mutex> lock(pauseMu_);
  // Cleared before anyone may wait again, or they would return at once.
  drainCounter(kickFd_);
  pauseRequested_ = false;
  pauseCv_.notify_all();
}

}  // namespace platform::dispatch::internal
