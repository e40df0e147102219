// What an event costs on its way to a handler: a one-byte echo over a Unix
// socket pair, answered by an FdSource's handler on a serial queue, next to
// the same echo answered by a thread blocked in read(). The caller writes a
// byte and blocks until the echo is back, so each iteration is one event
// delivered, one handler run and two wake-ups. Reported as ns_per_op and
// vs_thread (the ratio to the plain thread). The echo through a two-way
// source is left out when QV_BENCH_TWO_WAY_SOURCES is not defined, so that
// the plain one also builds against layers without two-way sources.
#include <benchmark/benchmark.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <chrono>
#include <cstdlib>
#include <thread>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"

namespace {

using platform::dispatch::FdSource;
using platform::dispatch::SerialQueue;
using Clock = std::chrono::steady_clock;

// `caller` blocks; `echo` is non-blocking, for whoever answers.
struct SocketPair {
  SocketPair() {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) != 0) std::abort();
    caller = fds[0];
    echo = fds[1];
  }
  ~SocketPair() {
    close(caller);
    if (echo >= 0) close(echo);
  }
  bool roundTrip() const {
    char byte = 'x';
    return write(caller, &byte, 1) == 1 && read(caller, &byte, 1) == 1;
  }
  int caller;
  int echo;
};

double nanosPerRoundTrip(const SocketPair& pair, int count) {
  auto start = Clock::now();
  for (int i = 0; i < count; ++i) {
    if (!pair.roundTrip()) std::abort();
  }
  return std::chrono::duration<double, std::nano>(Clock::now() - start).count() / count;
}

// The same echo with no dispatch layer: a thread blocked in read().
double threadEchoNanos() {
  SocketPair pair;
  std::thread echo([fd = pair.echo] {
    char byte;
    while (read(fd, &byte, 1) == 1) {
      if (write(fd, &byte, 1) != 1) return;
    }
  });
  nanosPerRoundTrip(pair, 2'000);  // warm
  double runs[5];
  for (double& r : runs) r = nanosPerRoundTrip(pair, 10'000);
  std::sort(std::begin(runs), std::end(runs));
  shutdown(pair.caller, SHUT_RDWR);
  echo.join();
  return runs[2];
}

// Echoes what is there; true when it read until EAGAIN.
bool echoAll(int fd) {
  char bytes[64];
  ssize_t n;
  while ((n = recv(fd, bytes, sizeof bytes, MSG_DONTWAIT)) > 0) {
    if (send(fd, bytes, size_t(n), MSG_DONTWAIT) != n) return false;
  }
  return n < 0 && errno == EAGAIN;
}

void runEcho(benchmark::State& state, const SocketPair& pair, FdSource& source) {
  const double baseline = threadEchoNanos();
  auto done = std::make_shared<platform::dispatch::Semaphore>();
  source.setCancelHandler([done] { done->signal(); });
  source.resume();
  nanosPerRoundTrip(pair, 2'000);  // warm
  auto start = Clock::now();
  for (auto _ : state) {
    if (!pair.roundTrip()) state.SkipWithError("echo failed");
  }
  double ns = std::chrono::duration<double, std::nano>(Clock::now() - start).count() /
              static_cast<double>(std::max<benchmark::IterationCount>(state.iterations(), 1));
  state.counters["ns_per_op"] = ns;
  state.counters["vs_thread"] = ns / baseline;
  source.cancel();
  done->wait();  // the fd stays open until no handler can touch it
}

// A plain handler: the source checks readiness after each call.
void BM_FdSourceEchoOnSerialQueue(benchmark::State& state) {
  SocketPair pair;
  const int fd = pair.echo;
  auto source = FdSource::create("bench.echo", platform::dispatch::Priority::Default, fd,
                                 FdSource::Event::Readable, SerialQueue::create("bench.echo"),
                                 [fd] { echoAll(fd); });
  if (!source.ok()) return state.SkipWithError("cannot watch the socket");
  runEcho(state, pair, *source.value());
}
BENCHMARK(BM_FdSourceEchoOnSerialQueue)->UseRealTime();

#ifdef QV_BENCH_TWO_WAY_SOURCES
// A handler that reads until EAGAIN and says so: no readiness check.
void BM_FdSourceDrainedEchoOnSerialQueue(benchmark::State& state) {
  SocketPair pair;
  const int fd = pair.echo;
  using Readiness = FdSource::Readiness;
  auto source = FdSource::createTwoWay(
      "bench.echo", platform::dispatch::Priority::Default, fd, SerialQueue::create("bench.echo"),
      [fd] { return echoAll(fd) ? Readiness::Drained : Readiness::MayRemain; }, nullptr);
  if (!source.ok()) return state.SkipWithError("cannot watch the socket");
  runEcho(state, pair, *source.value());
}
BENCHMARK(BM_FdSourceDrainedEchoOnSerialQueue)->UseRealTime();
#endif

}  // namespace
