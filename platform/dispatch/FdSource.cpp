#include "platform/dispatch/FdSource.h"

#include <poll.h>

#include <cstring>

#include "platform/dispatch/internal/Fatal.h"

namespace platform::dispatch {

using internal::Reactor;

namespace {

// Which reported bits concern which direction. A hangup or an error is
// news for both: the handler's next read or write is what reveals it.
constexpr std::uint32_t kReadBits = EPOLLIN | EPOLLPRI | EPOLLRDHUP | EPOLLHUP | EPOLLERR;
constexpr std::uint32_t kWriteBits = EPOLLOUT | EPOLLHUP | EPOLLERR;
constexpr std::uint32_t kHangupBits = EPOLLRDHUP | EPOLLHUP | EPOLLERR;

constexpr int indexOf(FdSource::Event event) {
  return event == FdSource::Event::Readable ? 0 : 1;
}

constexpr FdSource::Event kEvents[2] = {FdSource::Event::Readable, FdSource::Event::Writable};

}  // namespace

SysResult<std::shared_ptr<FdSource>> FdSource::create(std::string_view name, Priority priority,
                                                      int fd, Event event,
                                                      std::shared_ptr<Queue> target,
                                                      Closure handler) {
  // Shared so that the move-only closure fits a copyable Handler.
  auto shared = std::make_shared<Closure>(std::move(handler));
  Handler wrapped = [shared] {
    (*shared)();
    return Readiness::MayRemain;
  };
  Handler none;
  bool readable = event == Event::Readable;
  return registered(std::shared_ptr<FdSource>(new FdSource(name, priority, fd, std::move(target),
                                                           readable ? std::move(wrapped) : none,
                                                           readable ? none : std::move(wrapped))));
}

SysResult<std::shared_ptr<FdSource>> FdSource::createTwoWay(std::string_view name,
                                                            Priority priority, int fd,
                                                            std::shared_ptr<Queue> target,
                                                            Handler onReadable,
                                                            Handler onWritable) {
  return registered(std::shared_ptr<FdSource>(new FdSource(
      name, priority, fd, std::move(target), std::move(onReadable), std::move(onWritable))));
}

SysResult<std::shared_ptr<FdSource>> FdSource::registered(std::shared_ptr<FdSource> source) {
  Reactor& reactor = Reactor::instance();
  std::uint64_t key = reactor.add(source, source->priority_);
  std::lock_guard<std::mutex> lock(source->mu_);
  source->key_ = key;
  // Edge-triggered for the source's whole life, so that taking an event
  // needs no epoll_ctl to re-arm; registered with nothing wanted until
  // resume(). A hangup or error reported meanwhile is remembered.
  if (int err = reactor.watch(source->fd_, key, EPOLLET); err != 0) {
    reactor.remove(key);
    return SysResult<std::shared_ptr<FdSource>>::failure(err, "epoll_ctl");
  }
  return SysResult<std::shared_ptr<FdSource>>::success(std::move(source));
}

FdSource::FdSource(std::string_view name, Priority priority, int fd, std::shared_ptr<Queue> target,
                   Handler onReadable, Handler onWritable)
    : name_(name.substr(0, kMaxLabelLength)),
      priority_(priority),
      fd_(fd),
      target_(std::move(target)) {
  directions_[0].handler = std::move(onReadable);
  directions_[1].handler = std::move(onWritable);
}

FdSource::~FdSource() = default;

void FdSource::setCancelHandler(Closure handler) {
  std::lock_guard<std::mutex> lock(mu_);
  cancelHandler_ = std::move(handler);
}

void FdSource::setResumedLocked(Event event, bool resumed) {
  Direction& d = directions_[indexOf(event)];
  if (!d.handler || d.resumed == resumed) return;
  d.resumed = resumed;
  // Readiness noted while suspended may be stale (someone else may have
  // read meanwhile); the kernel reports what is true now when the
  // direction joins the interest set below.
  if (resumed) d.pending = false;
  std::uint32_t interest = EPOLLET;
  // EPOLLRDHUP: a peer's half-close must mark the source as hung up.
  if (directions_[0].resumed) interest |= EPOLLIN | EPOLLRDHUP;
  if (directions_[1].resumed) interest |= EPOLLOUT;
  // Dropped from the set while suspended, not merely ignored: a socket
  // whose peer reads would otherwise wake a thread for every read.
  if (int err = Reactor::instance().modify(fd_, key_, interest); err != 0) {
    internal::fatal("fd source '%s' cannot watch fd %d: %s (closed before its cancel handler ran?)",
                    name_.c_str(), fd_, std::strerror(err));
  }
}

void FdSource::resume() {
  std::lock_guard<std::mutex> lock(mu_);
  if (cancelled_) return;
  for (Event event : kEvents) setResumedLocked(event, true);
}

void FdSource::resume(Event event) {
  std::lock_guard<std::mutex> lock(mu_);
  if (!cancelled_) setResumedLocked(event, true);
}

void FdSource::suspend() {
  std::lock_guard<std::mutex> lock(mu_);
  if (cancelled_) return;
  for (Event event : kEvents) setResumedLocked(event, false);
}

void FdSource::suspend(Event event) {
  std::lock_guard<std::mutex> lock(mu_);
  if (!cancelled_) setResumedLocked(event, false);
}

void FdSource::cancel() {
  auto self = shared_from_this();
  bool finishNow;
  std::uint64_t key;
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (cancelled_) return;
    cancelled_ = true;
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

bool FdSource::dueLocked() const {
  for (const Direction& d : directions_) {
    if (d.handler && d.resumed && d.pending) return true;
  }
  return false;
}

Closure FdSource::onReady(std::uint32_t events, internal::RunSlot* slot) {
  {
    std::lock_guard<std::mutex> lock(mu_);
    if (events & kReadBits) directions_[0].pending = true;
    if (events & kWriteBits) directions_[1].pending = true;
    if (events & kHangupBits) hungUp_ = true;
    // Reports for a suspended direction stay pending; reports during a
    // delivery are picked up when it ends.
    if (cancelled_ || inFlight_ || !dueLocked()) return Closure();
    inFlight_ = true;
  }
  auto self = shared_from_this();
  if (slot != nullptr && slot->acquire(target_->priority())) {
    if (target_->tryClaim()) {
      return [self] {
        Closure work = [self] { self->deliver(); };
        self->target_->runClaimed(work);
      };
    }
    slot->release();
  }
  target_->async([self] { self->deliver(); });
  return Closure();
}

void FdSource::deliver() {
  for (Event event : kEvents) {
    Direction& d = directions_[indexOf(event)];
    bool trustDrained;
    {
      std::lock_guard<std::mutex> lock(mu_);
      // Decided just before running: the read handler may have suspended
      // writes, or cancelled the source.
      if (cancelled_ || !d.handler || !d.resumed || !d.pending) continue;
      d.pending = false;
      trustDrained = !hungUp_;
    }
    // Only finishCancel() touches the handlers otherwise, and not while a
    // delivery is in flight.
    Readiness readiness = d.handler();
    if (readiness == Readiness::Drained && !trustDrained) readiness = Readiness::MayRemain;
    if (readiness == Readiness::MayRemain && stillReady(event)) {
      std::lock_guard<std::mutex> lock(mu_);
      d.pending = true;
    }
  }
  bool finish = false;
  bool again = false;
  {
    std::lock_guard<std::mutex> lock(mu_);
    inFlight_ = false;
    if (cancelled_) {
      finish = true;
    } else if (dueLocked()) {
      // Behind whatever the queue has meanwhile, like any new event.
      inFlight_ = true;
      again = true;
    }
  }
  if (finish) {
    finishCancel();
  } else if (again) {
    target_->async([self = shared_from_this()] { self->deliver(); });
  }
}

bool FdSource::stillReady(Event event) const {
  pollfd p{fd_, static_cast<short>(event == Event::Readable ? POLLIN | POLLPRI : POLLOUT), 0};
  if (::poll(&p, 1, 0) != 1) return false;
  const short bits = event == Event::Readable ? (POLLIN | POLLPRI | POLLRDHUP | POLLHUP | POLLERR)
                                              : (POLLOUT | POLLHUP | POLLERR);
  return (p.revents & bits) != 0;
}

void FdSource::finishCancel() {
  Closure cancelHandler;
  Handler handlers[2];
  {
    std::lock_guard<std::mutex> lock(mu_);
    cancelHandler = std::move(cancelHandler_);
    handlers[0] = std::move(directions_[0].handler);
    handlers[1] = std::move(directions_[1].handler);
    directions_[0].handler = nullptr;
    directions_[1].handler = nullptr;
  }
  if (cancelHandler) cancelHandler();
  // Both handlers, and whatever they captured, are released here.
}

}  // namespace platform::dispatch
