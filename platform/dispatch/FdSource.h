// Watches a file descriptor for read readiness, write readiness or both,
// and runs a handler per direction on a target queue when the fd is ready.
// Sources are cheap (one epoll entry, no thread), so a daemon can hold one
// per connection.
//
// Delivery: while a handler of the source is pending or running no other
// one is started, so the read and write handlers of one source never
// overlap, and neither overlaps itself. Readiness is level-triggered from
// the handler's point of view: data left unread (room left unused) is
// reported again. A handler that went on until EAGAIN, or got a short
// read from a stream socket, may say so (Readiness::Drained) and spare the
// source a readiness check; the next arrival is reported as usual. Once the
// fd has reported a hangup or an error the source checks anyway, since a
// hangup that came with the last data is not reported twice. A handler that
// says Drained without such evidence may wait for the next arrival to hear
// of what it left.
//
// When the target queue is idle, the pool thread that took the event runs
// the handler itself, claiming the queue as any turn would (no other item
// of it runs meanwhile, later items wait, isCurrent() holds); otherwise the
// handler is posted behind what the queue already has.
//
// A source starts suspended. It stays alive, holding its handlers, until it
// is cancelled, even when its creator lets go of it. After cancel(), the
// cancel handler runs once on the target queue when the fd is no longer
// watched and no event handler will run again; that is where the owner
// closes the fd. The handlers are released after it.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <cstdint>
#include <functional>
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
  // What a handler knows about the fd when it returns.
  enum class Readiness {
    Drained,    // it read (or wrote) until EAGAIN: nothing to check
    MayRemain,  // it stopped early: the source checks, and reports again if still ready
  };
  using Handler = std::function<Readiness()>;

  // Watches `fd` (which the caller keeps open until the cancel handler has
  // run) for `event`. `priority` orders this source's delivery among sources
  // ready at the same moment; `name` identifies it in diagnostics. Fails
  // when epoll refuses the fd (EBADF, or EPERM for a regular file). The
  // handler is treated as Readiness::MayRemain.
  static SysResult<std::shared_ptr<FdSource>> create(std::string_view name, Priority priority,
                                                     int fd, Event event,
                                                     std::shared_ptr<Queue> target,
                                                     Closure handler);
  // Watches both directions of `fd`, each with its own handler, resumed and
  // suspended on its own. Otherwise as create().
  static SysResult<std::shared_ptr<FdSource>> createTwoWay(std::string_view name, Priority priority,
                                                           int fd, std::shared_ptr<Queue> target,
                                                           Handler onReadable, Handler onWritable);
  ~FdSource() override;

  const std::string& name() const { return name_; }
  Priority priority() const { return priority_; }
  int fd() const { return fd_; }

  // REQUIRES: called before cancel(); a later call replaces the handler.
  void setCancelHandler(Closure handler);

  // Starts (or restarts) watching every direction that has a handler, or
  // only `event`. No effect once cancelled.
  void resume();
  void resume(Event event);
  // Stops watching; a handler already posted but not yet started is
  // skipped. A handler already running finishes.
  void suspend();
  void suspend(Event event);
  // Stops watching for good; see the class comment. Idempotent.
  void cancel();

  bool isCancelled() const;

 private:
  struct Direction {
    Handler handler;       // empty: this direction is not watched
    bool resumed = false;  // wanted, and in the kernel's interest set
    bool pending = false;  // reported and not yet handed to the handler
  };

  FdSource(std::string_view name, Priority priority, int fd, std::shared_ptr<Queue> target,
           Handler onReadable, Handler onWritable);
  static SysResult<std::shared_ptr<FdSource>> registered(std::shared_ptr<FdSource> source);
  Closure onReady(std::uint32_t events, internal::RunSlot* slot) override;
  void deliver();
  void finishCancel();
  bool dueLocked() const;
  void setResumedLocked(Event event, bool resumed);
  bool stillReady(Event event) const;

  const std::string name_;
  const Priority priority_;
  const int fd_;
  const std::shared_ptr<Queue> target_;
  std::uint64_t key_ = 0;  // the reactor's name for this source

  mutable std::mutex mu_;
  Direction directions_[2];  // indexed by Event; handlers run without mu_
  Closure cancelHandler_;
  bool cancelled_ = false;
  bool inFlight_ = false;  // a delivery is posted or running
  bool hungUp_ = false;    // a hangup or error was reported: Drained is not trusted
};

}  // namespace platform::dispatch
