// A timer that runs a handler on a target queue: once after a delay, or
// repeatedly at an interval. It is an FdSource on a timerfd, so it shares
// the source rules: it starts suspended, ticks are delivered one at a time
// (ticks missed while a handler runs collapse into one), and after cancel()
// the cancel handler runs once no tick handler will run again.
//
// Also after(): run work on a queue once a delay has passed, without a
// source of one's own (all such deadlines share one timerfd).
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <string_view>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/SysResult.h"

namespace platform::dispatch {

class TimerSource {
 public:
  // Fails when the process is out of file descriptors.
  static SysResult<std::shared_ptr<TimerSource>> create(std::string_view name, Priority priority,
                                                        std::shared_ptr<Queue> target,
                                                        Closure handler);

  TimerSource(const TimerSource&) = delete;
  TimerSource& operator=(const TimerSource&) = delete;

  // Fires once, `delay` from now (replacing any earlier schedule).
  void scheduleOnce(std::chrono::nanoseconds delay);
  // Fires `first` from now, then every `interval`.
  // REQUIRES: interval > 0.
  void scheduleRepeating(std::chrono::nanoseconds first, std::chrono::nanoseconds interval);
  // Stops firing until scheduled again.
  void disarm();

  // As for FdSource. After cancel() the schedule calls do nothing.
  void setCancelHandler(Closure handler);
  void resume() { source_->resume(); }
  void suspend() { source_->suspend(); }
  void cancel() { source_->cancel(); }

  const std::string& name() const { return source_->name(); }

 private:
  struct Clock;  // the timerfd, shared with the source's handlers
  TimerSource(std::shared_ptr<Clock> clock, std::shared_ptr<FdSource> source);
  void set(std::chrono::nanoseconds first, std::chrono::nanoseconds interval);

  const std::shared_ptr<Clock> clock_;
  const std::shared_ptr<FdSource> source_;
};

// Posts `work` to `queue` once `delay` has passed (at once for a delay <= 0).
void after(std::chrono::nanoseconds delay, std::shared_ptr<Queue> queue, Closure work);

}  // namespace platform::dispatch
