// Delivers a signal (SIGTERM, SIGHUP, ...) as a handler run on a target
// queue, usually the main queue, instead of an asynchronous signal handler.
// create() blocks the signal in the calling thread and reads it from a
// signalfd. Threads of this layer start with every signal blocked; create
// signal sources on the main thread before starting threads of your own, so
// that every thread has the signal blocked and only the signalfd takes it.
//
// It is an FdSource on the signalfd and shares the source rules: it starts
// suspended, and after cancel() the cancel handler runs once no handler
// will run again. The signal stays blocked after cancel().
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <memory>
#include <string_view>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/SysResult.h"

namespace platform::dispatch {

class SignalSource {
 public:
  // Runs `handler` once per delivery of `signal`. Fails for a signal that
  // cannot be caught (SIGKILL, SIGSTOP) or when out of file descriptors.
  // REQUIRES: no other SignalSource watches `signal`.
  static SysResult<std::shared_ptr<SignalSource>> create(std::string_view name, int signal,
                                                         Priority priority,
                                                         std::shared_ptr<Queue> target,
                                                         Closure handler);

  SignalSource(const SignalSource&) = delete;
  SignalSource& operator=(const SignalSource&) = delete;

  int signal() const { return signal_; }
  const std::string& name() const { return source_->name(); }

  // As for FdSource.
  void setCancelHandler(Closure handler);
  void resume() { source_->resume(); }
  void suspend() { source_->suspend(); }
  void cancel() { source_->cancel(); }

  // Signals read from the signalfd per handler turn.
  static constexpr int kMaxSignalsPerTurn = 16;

 private:
  struct Reader;  // the signalfd, shared with the source's handlers
  SignalSource(int signal, std::shared_ptr<Reader> reader, std::shared_ptr<FdSource> source);

  const int signal_;
  const std::shared_ptr<Reader> reader_;
  const std::shared_ptr<FdSource> source_;
};

}  // namespace platform::dispatch
