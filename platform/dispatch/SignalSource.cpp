#include "platform/dispatch/SignalSource.h"

#include <pthread.h>
#include <signal.h>
#include <sys/signalfd.h>
#include <unistd.h>

#include <cerrno>
#include <mutex>

namespace platform::dispatch {

struct SignalSource::Reader {
  std::mutex mu;
  int fd;
  Closure cancelHandler;
};

SysResult<std::shared_ptr<SignalSource>> SignalSource::create(std::string_view name, int signal,
                                                              Priority priority,
                                                              std::shared_ptr<Queue> target,
                                                              Closure handler) {
  using Result = SysResult<std::shared_ptr<SignalSource>>;
  if (signal <= 0 || signal >= NSIG || signal == SIGKILL || signal == SIGSTOP) {
    return Result::failure(EINVAL, "signalfd");
  }
  sigset_t mask;
  sigemptyset(&mask);
  sigaddset(&mask, signal);
  // Blocked first: a signal arriving now stays pending for the signalfd
  // instead of running the default action (which, for SIGTERM, ends us).
  if (int err = pthread_sigmask(SIG_BLOCK, &mask, nullptr); err != 0) {
    return Result::failure(err, "pthread_sigmask");
  }
  int fd = signalfd(-1, &mask, SFD_NONBLOCK | SFD_CLOEXEC);
  if (fd < 0) return Result::failure(errno, "signalfd");
  auto reader = std::make_shared<Reader>();
  reader->fd = fd;

  auto onReadable = [reader, handler = std::move(handler)]() mutable {
    // Bounded per turn so a signal storm cannot hold the queue; the rest is
    // reported again after the handler returns.
    for (int i = 0; i < kMaxSignalsPerTurn; ++i) {
      signalfd_siginfo info;
      if (::read(reader->fd, &info, sizeof info) != sizeof info) break;
      handler();
    }
  };
  auto source = FdSource::create(name, priority, fd, FdSource::Event::Readable, std::move(target),
                                 std::move(onReadable));
  if (!source.ok()) {
    ::close(fd);
    return Result::failure(source.error(), "epoll_ctl");
  }
  source.value()->setCancelHandler([reader] {
    Closure userHandler;
    {
      std::lock_guard<std::mutex> lock(reader->mu);
      ::close(reader->fd);
      userHandler = std::move(reader->cancelHandler);
    }
    if (userHandler) userHandler();
  });
  return Result::success(std::shared_ptr<SignalSource>(
      new SignalSource(signal, std::move(reader), std::move(source).value())));
}

SignalSource::SignalSource(int signal, std::shared_ptr<Reader> reader,
                           std::shared_ptr<FdSource> source)
    : signal_(signal), reader_(std::move(reader)), source_(std::move(source)) {}

void SignalSource::setCancelHandler(Closure handler) {
  std::lock_guard<std::mutex> lock(reader_->mu);
  reader_->cancelHandler = std::move(handler);
}

}  // namespace platform::dispatch
