// What a request and its reply cost through the message system, next to the
// limit: the same bytes bounced over a plain Unix socket by blocking
// read/write. Both servers run in forked child processes (forked before this
// process starts any thread). Each benchmark reports the median and p99 of
// single round trips; the summary at the end prints the ratio.
#include <benchmark/benchmark.h>
#include <sched.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <string>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/Listener.h"
#include "platform/mbx/Reply.h"
#include "platform/root/Root.h"

namespace {

using namespace platform;
using Clock = std::chrono::steady_clock;

// A registration-style request of about 200 bytes of CBOR.
Value requestBody() {
  return Dictionary{{"op", "lookup"},
                    {"bundle", "com.corvane.example.plugin"},
                    {"version", "1.2.3"},
                    {"flags", 3},
                    {"path", "/Library/Plugins/Example.plugin/Contents/Info.vmap"},
                    {"uuid", Uuid::parse("E621E1F8-C36C-495A-93FC-0C247A3E6E5F").value()},
                    {"session", 123456789},
                    {"note", "a short note to bring this to two hundred bytes"}};
}

std::string gRoot;
std::size_t gFrameBytes = 0;
int gRawFd = -1;
int gLifeWriteFd = -1;
std::vector<double> gMbxMicros;
std::vector<double> gRawMicros;

std::string rawSocketPath() {
  return gRoot + "/raw.sock";
}

// The message-system server: answers every request with the request's own
// entries, so that the reply is as large as the request.
[[noreturn]] void runMbxServer(int readyFd, int lifeFd) {
  auto queue = dispatch::SerialQueue::create("bench.listener");
  auto listener = mbx::Listener::create("bench", queue);
  if (!listener.ok()) ::_exit(2);
  listener.value()->setEventHandler([](const mbx::Listener::Event& event) {
    const auto* connection = std::get_if<std::shared_ptr<mbx::Connection>>(&event);
    if (connection == nullptr) return;
    (*connection)->setEventHandler([](const mbx::ConnectionEvent& e) {
      const auto* message = std::get_if<mbx::Message>(&e);
      if (message == nullptr || !message->expectsReply()) return;
      mbx::Reply reply = mbx::Reply::createReply(*message);
      reply.body() = *message->dictionary();
      (void)reply.send();
    });
    (*connection)->resume();
  });
  listener.value()->resume();
  char ready = 1;
  (void)!::write(readyFd, &ready, 1);
  char sink;
  (void)!::read(lifeFd, &sink, 1);  // returns when the benchmark process ends
  ::_exit(0);
}

// The limit: reads a frame's worth of bytes and writes them straight back.
[[noreturn]] void runRawServer(int readyFd, int lifeFd) {
  int listenFd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, rawSocketPath().c_str(), sizeof address.sun_path - 1);
  if (::bind(listenFd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0 ||
      ::listen(listenFd, 1) != 0) {
    ::_exit(2);
  }
  char ready = 1;
  (void)!::write(readyFd, &ready, 1);
  int fd = ::accept(listenFd, nullptr, nullptr);
  std::vector<char> buffer(gFrameBytes);
  for (;;) {
    std::size_t have = 0;
    while (have < buffer.size()) {
      ssize_t n = ::read(fd, buffer.data() + have, buffer.size() - have);
      if (n <= 0) ::_exit(0);
      have += static_cast<std::size_t>(n);
    }
    if (::write(fd, buffer.data(), buffer.size()) != static_cast<ssize_t>(buffer.size())) ::_exit(0);
  }
  (void)lifeFd;
}

pid_t forkServer(void (*body)(int, int), int lifeFd) {
  int ready[2];
  if (::pipe(ready) != 0) std::abort();
  pid_t pid = ::fork();
  if (pid == 0) {
    ::close(ready[0]);
    ::close(gLifeWriteFd);
    body(ready[1], lifeFd);
  }
  ::close(ready[1]);
  char byte;
  if (::read(ready[0], &byte, 1) != 1) std::abort();
  ::close(ready[0]);
  return pid;
}

double percentile(std::vector<double> samples, double p) {
  if (samples.empty()) return 0;
  std::sort(samples.begin(), samples.end());
  return samples[static_cast<std::size_t>(p * static_cast<double>(samples.size() - 1))];
}

void report(benchmark::State& state, const std::vector<double>& samples) {
  state.counters["median_us"] = percentile(samples, 0.5);
  state.counters["p99_us"] = percentile(samples, 0.99);
}

void BM_MbxRoundTrip(benchmark::State& state) {
  auto connection = mbx::Connection::connectToService("bench");
  if (!connection.ok()) {
    state.SkipWithError("connect failed");
    return;
  }
  connection.value()->setEventHandler([](const mbx::ConnectionEvent&) {});
  connection.value()->resume();
  const Value body = requestBody();
  for (int i = 0; i < 1000; ++i) (void)connection.value()->sendWithReplySync(body);  // warm
  gMbxMicros.clear();
  for (auto _ : state) {
    const auto start = Clock::now();
    auto reply = connection.value()->sendWithReplySync(body);
    gMbxMicros.push_back(std::chrono::duration<double, std::micro>(Clock::now() - start).count());
    if (!reply.ok()) state.SkipWithError("no reply");
  }
  report(state, gMbxMicros);
  connection.value()->cancel();
}

void BM_RawSocketPingPong(benchmark::State& state) {
  std::vector<char> frame(gFrameBytes, 'x');
  std::vector<char> back(gFrameBytes);
  auto bounce = [&] {
    if (::write(gRawFd, frame.data(), frame.size()) != static_cast<ssize_t>(frame.size())) return false;
    std::size_t have = 0;
    while (have < back.size()) {
      ssize_t n = ::read(gRawFd, back.data() + have, back.size() - have);
      if (n <= 0) return false;
      have += static_cast<std::size_t>(n);
    }
    return true;
  };
  for (int i = 0; i < 1000; ++i) bounce();  // warm
  gRawMicros.clear();
  for (auto _ : state) {
    const auto start = Clock::now();
    bool ok = bounce();
    gRawMicros.push_back(std::chrono::duration<double, std::micro>(Clock::now() - start).count());
    if (!ok) state.SkipWithError("raw echo failed");
  }
  report(state, gRawMicros);
}

BENCHMARK(BM_RawSocketPingPong)->Iterations(20000)->Unit(benchmark::kMicrosecond);
BENCHMARK(BM_MbxRoundTrip)->Iterations(20000)->Unit(benchmark::kMicrosecond);

}  // namespace

// Both processes on one CPU (the first this process may use), unless
// QV_BENCH_UNPINNED is set: in a VM, waking an idle second vCPU costs tens of
// microseconds and would swamp what is measured, raw and mbx alike.
void pinToOneCpu() {
  if (std::getenv("QV_BENCH_UNPINNED") != nullptr) return;
  cpu_set_t allowed;
  if (::sched_getaffinity(0, sizeof allowed, &allowed) != 0) return;
  for (int cpu = 0; cpu < CPU_SETSIZE; ++cpu) {
    if (!CPU_ISSET(cpu, &allowed)) continue;
    cpu_set_t one;
    CPU_ZERO(&one);
    CPU_SET(cpu, &one);
    if (::sched_setaffinity(0, sizeof one, &one) == 0) std::printf("pinned to CPU %d\n", cpu);
    return;
  }
}

int main(int argc, char** argv) {
  pinToOneCpu();  // before the fork, so that the servers share the CPU
  char pattern[] = "/tmp/mbx-bench-XXXXXX";
  gRoot = ::mkdtemp(pattern);
  setRootDirectoryForTesting(gRoot);
  Result<std::vector<std::uint8_t>> frame = mbx::encodeFrame(mbx::FrameKind::Request, 0, requestBody());
  gFrameBytes = frame.value().size();

  // Both servers are forked before anything here starts a thread. They end
  // when the life pipe closes, that is when this process exits.
  int life[2];
  if (::pipe(life) != 0) return 1;
  gLifeWriteFd = life[1];
  pid_t mbxServer = forkServer(runMbxServer, life[0]);
  pid_t rawServer = forkServer(runRawServer, life[0]);
  ::close(life[0]);

  gRawFd = ::socket(AF_UNIX, SOCK_STREAM, 0);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, rawSocketPath().c_str(), sizeof address.sun_path - 1);
  if (::connect(gRawFd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) return 1;

  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();

  const double raw = percentile(gRawMicros, 0.5);
  const double mbx = percentile(gMbxMicros, 0.5);
  std::printf("\nframe of %zu bytes each way\n", gFrameBytes);
  std::printf("%-22s median %7.2f us   p99 %7.2f us\n", "raw socket ping-pong", raw,
              percentile(gRawMicros, 0.99));
  std::printf("%-22s median %7.2f us   p99 %7.2f us\n", "mbx round trip", mbx,
              percentile(gMbxMicros, 0.99));
  if (raw > 0) std::printf("ratio (median)         %.2fx\n", mbx / raw);

  ::close(gRawFd);
  ::close(life[1]);
  ::waitpid(mbxServer, nullptr, 0);
  ::waitpid(rawServer, nullptr, 0);
  std::error_code ignored;
  std::filesystem::remove_all(gRoot, ignored);
  return 0;
}
