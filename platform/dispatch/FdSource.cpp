#include "platform/dispatch/FdSource.h"

#include <cstring>

#include "platform/dispatch/internal/Fatal.h"

namespace platform::dispatch {

using internal::Reactor;

SysResult<std::shared_ptr<FdSource>> FdSource::create(std::string_view name, Priority priority,
                                                      int fd, Event event,
                                                      std::shared_ptr<Queue> target,
                                                      Closure handler) {
  std::shared_ptr<FdSource> source(
      new FdSource(name, priority, fd, event, std::move(target), std::move(handler)));
  Reactor& reactor = Reactor::instance();
  std::uint64_t key = reactor.add(source, priority);
  {
    std::lock_guard<std::mutex> lock(source->mu_);
    source->key_ = key;
  }
  // Registered disarmed: a one-shot watch for no event. The kernel may still
  // report an error or hangup once, which onReady() ignores while disarmed.
  if (int err = reactor.watch(fd, key, EPOLLONESHOT); err != 0) {
    reactor.remove(key);
    return SysResult<std::shared_ptr<FdSource>>::failure(err, "epoll_ctl");
  }
  return SysResult<std::shared_ptr<FdSource>>::success(std::move(source));
}

FdSource::FdSource(std::string_view name, Priority priority, int fd, Event event,
                   std::shared_ptr<Queue> target, Closure handler)
    : name_(name.substr(0, kMaxLabelLength)),
      priority_(priority),
      fd_(fd),
      event_(event),
      target_(std::move(target)),
      handler_(std::move(handler)) {}

FdSource::~FdSource() = default;

void FdSource::setCancelHandler(Closure handler) {
  std::lock_guard<std::mutex> lock(mu_);
  cancelHandler_ = std::move(handler);
}

std::uint32_t FdSource::epollEventsLocked() const {
  return EPOLLONESHOT | (event_ == Event::Readable ? EPOLLIN : EPOLLOUT);
}

void FdSource::armLocked() {
  if (int err = Reactor::instance().modify(fd_, key_, epollEventsLocked()); err != 0) {
    internal::fatal("fd source '%s' cannot watch fd %d: %s (closed before its cancel handler ran?)",
                    name_.c_str(), fd_, std::strerror(err));
  }
  armed_ = true;
}

void FdSource::resume() {
  std::lock_guard<std::mutex> lock(mu_);
  if (cancelled_ || !suspended_) return;
  suspended_ = false;
  // With a delivery in flight, deliver() re-arms once the handler is done.
  if (!inFlight_) armLocked();
}

void FdSource::suspend() {
  std::lock_guard<std::mutex> lock(mu_);
  if (cancelled_ || suspended_) return;
  suspended_ = true;
  if (armed_) {
    // A readiness the reactor already took is dropped by onReady(); being
    // level-triggered, it is reported again after resume().
    Reactor::instance().modify(fd_, key_, EPOLLONESHOT);
    armed_ = false;
  }
}

void FdSource::cancel() {
  auto self = shared_from_this();
  bool finishNow;
  std::uint64_t key;
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (cancelled_) return;
    cancelled_ = true;
    armed_ = false;
    // Every epoll_ctl on fd_ happens under mu_, and none after this one, so
    // the owner may close (and the process reuse) the fd once the cancel
    // handler runs. An fd closed early has left the set already.
    Reactor::instance().unwatch(fd_);
    finishNow = !inFlight_;
    key = key_;
  }
  Reactor::instance().remove(key);
  // With a delivery in flight, deliver() finishes the cancel after it.
  if (finishNow) target_->async([self] { self->finishCancel(); });
}

bool FdSource::isCancelled() const {
  std::lock_guard<std::mutex> lock(mu_);
  return cancelled_;
}

void FdSource::onReady() {
  {
    std::lock_guard<std::mutex> lock(mu_);
    // Stale reports (taken by the reactor just before a suspend or cancel,
    // or a hangup while disarmed) are dropped here.
    if (cancelled_ || suspended_ || !armed_ || inFlight_) return;
    armed_ = false;
    inFlight_ = true;
  }
  target_->async([self = shared_from_this()] { self->deliver(); });
}

void FdSource::deliver() {
  bool run;
  {
    std::lock_guard<std::mutex> lock(mu_);
    run = !cancelled_ && !suspended_;
  }
  if (run) handler_();
  bool finish = false;
  {
    std::lock_guard<std::mutex> lock(mu_);
    inFlight_ = false;
    if (cancelled_) {
      finish = true;
    } else if (!suspended_) {
      armLocked();
    }
  }
  if (finish) finishCancel();
}

void FdSource::finishCancel() {
  Closure cancelHandler;
  Closure handler;
  {
    std::lock_guard<std::mutex> lock(mu_);
    cancelHandler = std::move(cancelHandler_);
    handler = std::move(handler_);
  }
  if (cancelHandler) cancelHandler();
  // Both handlers, and whatever they captured, are released here.
}

}  // namespace platform::dispatch
