// Watches a file descriptor for read or write readiness and runs a handler
// on a target queue when it is ready. Sources are cheap (one epoll entry, no
// thread), so a daemon can hold one per connection.
//
// Delivery is one-shot: while a handler is pending or running no second one
// is posted; the watch is re-armed after the handler returns. Readiness is
// level-triggered, so data the handler leaves unread is reported again.
// The handler should read or write until EAGAIN or until it has done enough.
//
// A source starts suspended. It stays alive, holding its handlers, until it
// is cancelled, even when its creator lets go of it. After cancel(), the
// cancel handler runs once on the target queue when the fd is no longer
// watched and no event handler will run again; that is where the owner
// closes the fd. Both handlers are released after it.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/dispatch/Priority.h"
#include "platform/dispatch/Queue.h"
#include "platform/dispatch/SysResult.h"
#include "platform/dispatch/internal/Reactor.h"

namespace platform::dispatch {

class FdSource final : public internal::ReadyTarget, public std::enable_shared_from_this<FdSource> {
 public:
  enum class Event { Readable, Writable };

  // Watches `fd` (which the caller keeps open until the cancel handler has
  // run) for `event`. `priority` orders this source's delivery among sources
  // ready at the same moment; `name` identifies it in diagnostics. Fails
  // when epoll refuses the fd (EBADF, or EPERM for a regular file).
  static SysResult<std::shared_ptr<FdSource>> create(std::string_view name, Priority priority,
                                                     int fd, Event event,
                                                     std::shared_ptr<Queue> target,
                                                     Closure handler);
  ~FdSource() override;

  const std::string& name() const { return name_; }
  Priority priority() const { return priority_; }
  int fd() const { return fd_; }

  // REQUIRES: called before cancel(); a later call replaces the handler.
  void setCancelHandler(Closure handler);

  // Starts (or restarts) watching. No effect once cancelled.
  void resume();
  // Stops watching; a handler already posted but not yet started is skipped.
  // A handler already running finishes.
  void suspend();
  // Stops watching for good; see the class comment. Idempotent.
  void cancel();

  bool isCancelled() const;

 private:
  FdSource(std::string_view name, Priority priority, int fd, Event event,
           std::shared_ptr<Queue> target, Closure handler);
  void onReady() override;
  void deliver();
  void finishCancel();
  void armLocked();
  std::uint32_t epollEventsLocked() const;

  const std::string name_;
  const Priority priority_;
  const int fd_;
  const Event event_;
  const std::shared_ptr<Queue> target_;
  std::uint64_t key_ = 0;  // the reactor's name for this source

  mutable std::mutex mu_;
  Closure handler_;  // run without mu_; only one delivery at a time
  Closure cancelHandler_;
  bool suspended_ = true;
  bool cancelled_ = false;
  bool armed_ = false;     // the kernel will report the next readiness
  bool inFlight_ = false;  // a delivery is posted or running
};

}  // namespace platform::dispatch
