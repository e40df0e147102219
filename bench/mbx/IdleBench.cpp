// What idle connections cost the server: a client process opens as many
// connections as the descriptor limit allows (10,000 when it can) and leaves
// them idle; the server, this process, accepts each (taking the peer's
// identity), gives it an event handler and a context, and resumes it. The
// counters are the server's thread count before and after, and its resident
// memory per connection. The client is forked before this process starts
// any thread and uses plain sockets.
#include <benchmark/benchmark.h>
#include <stdlib.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include "platform/dispatch/SerialQueue.h"
#include "platform/mbx/Connection.h"
#include "platform/mbx/Listener.h"
#include "platform/root/Root.h"

namespace {

using namespace platform;
using namespace std::chrono_literals;

constexpr std::size_t kWanted = 10000;

std::string gRoot;
std::size_t gConnections = 0;
int gGoFd = -1;  // the client connects when this pipe gets a byte, and leaves at EOF

// A field of /proc/self/status, in its own unit (kB for memory).
long statusField(const char* name) {
  std::ifstream status("/proc/self/status");
  std::string line;
  const std::size_t length = std::strlen(name);
  while (std::getline(status, line)) {
    if (line.compare(0, length, name) == 0 && line[length] == ':') {
      return std::stol(line.substr(length + 1));
    }
  }
  return -1;
}

[[noreturn]] void runClient(int goFd, std::string path, std::size_t count) {
  char byte;
  if (::read(goFd, &byte, 1) != 1) ::_exit(1);
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  std::vector<int> fds;
  for (std::size_t i = 0; i < count; ++i) {
    int fd = ::socket(AF_UNIX, SOCK_STREAM, 0);
    if (fd < 0 || ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
      ::_exit(2);
    }
    fds.push_back(fd);
  }
  (void)!::read(goFd, &byte, 1);  // hold them until told to go
  ::_exit(0);
}

void BM_IdleConnections(benchmark::State& state) {
  auto queue = dispatch::SerialQueue::create("bench.listener");
  auto listener = mbx::Listener::create("idle", queue);
  if (!listener.ok()) {
    state.SkipWithError("listen failed");
    return;
  }
  std::atomic<std::size_t> accepted{0};
  std::atomic<std::size_t> identified{0};
  std::atomic<std::size_t> invalid{0};
  listener.value()->setEventHandler([&](const mbx::Listener::Event& event) {
    const auto* connection = std::get_if<std::shared_ptr<mbx::Connection>>(&event);
    if (connection == nullptr) return;
    if ((*connection)->peer() != nullptr) ++identified;
    (*connection)->setEventHandler([&invalid](const mbx::ConnectionEvent& e) {
      if (std::holds_alternative<mbx::ConnectionError>(e)) ++invalid;
    });
    (*connection)->setContext(std::make_shared<std::uint64_t>(accepted.load()));
    (*connection)->resume();
    ++accepted;
  });
  listener.value()->resume();

  // Warm up the dispatch layer and the listener's path once, so that the
  // baseline already holds every fixed cost.
  {
    auto warm = mbx::Connection::connectToService("idle");
    warm.value()->setEventHandler([](const mbx::ConnectionEvent&) {});
    warm.value()->resume();
    while (accepted.load() < 1) std::this_thread::sleep_for(1ms);
    warm.value()->cancel();
    while (invalid.load() < 1) std::this_thread::sleep_for(1ms);
  }
  std::this_thread::sleep_for(200ms);
  const long threadsBefore = statusField("Threads");
  const long rssBefore = statusField("VmRSS");

  for (auto _ : state) {
    char go = 1;
    (void)!::write(gGoFd, &go, 1);
    const auto deadline = std::chrono::steady_clock::now() + 120s;
    while (accepted.load() < gConnections + 1 && std::chrono::steady_clock::now() < deadline) {
      std::this_thread::sleep_for(10ms);
    }
  }
  std::this_thread::sleep_for(500ms);
  const long threadsAfter = statusField("Threads");
  const long rssAfter = statusField("VmRSS");
  const std::size_t connections = accepted.load() - 1;

  state.counters["connections"] = static_cast<double>(connections);
  state.counters["identified"] = static_cast<double>(identified.load() - 1);
  state.counters["threads_before"] = static_cast<double>(threadsBefore);
  state.counters["threads_after"] = static_cast<double>(threadsAfter);
  state.counters["rss_KiB_per_conn"] =
      connections ? static_cast<double>(rssAfter - rssBefore) / static_cast<double>(connections) : 0;
  std::printf("idle: %zu connections (%zu identified); threads %ld -> %ld; VmRSS %ld -> %ld kB, "
              "%.2f KiB per connection\n",
              connections, identified.load() - 1, threadsBefore, threadsAfter, rssBefore, rssAfter,
              connections ? static_cast<double>(rssAfter - rssBefore) / static_cast<double>(connections)
                          : 0.0);

  // Let the client go; every connection must end.
  ::close(gGoFd);
  const auto deadline = std::chrono::steady_clock::now() + 60s;
  while (invalid.load() < connections + 1 && std::chrono::steady_clock::now() < deadline) {
    std::this_thread::sleep_for(10ms);
  }
  std::printf("idle: %zu connections ended; threads %ld\n", invalid.load() - 1,
              statusField("Threads"));
  listener.value()->cancel();
}

BENCHMARK(BM_IdleConnections)->Iterations(1)->Unit(benchmark::kMillisecond);

}  // namespace

int main(int argc, char** argv) {
  // Each server connection holds one descriptor, its socket.
  rlimit limit{};
  ::getrlimit(RLIMIT_NOFILE, &limit);
  limit.rlim_cur = limit.rlim_max;
  ::setrlimit(RLIMIT_NOFILE, &limit);
  const std::size_t reserve = 64;
  gConnections = std::min<std::size_t>(kWanted, limit.rlim_cur - reserve);
  std::printf("RLIMIT_NOFILE %llu: holding %zu connections\n",
              static_cast<unsigned long long>(limit.rlim_cur), gConnections);

  char pattern[] = "/tmp/mbx-idle-XXXXXX";
  gRoot = ::mkdtemp(pattern);
  setRootDirectoryForTesting(gRoot);
  int go[2];
  if (::pipe(go) != 0) return 1;
  pid_t client = ::fork();
  if (client == 0) {
    ::close(go[1]);
    runClient(go[0], gRoot + "/run/quorvex/mbx/idle", gConnections);
  }
  ::close(go[0]);
  gGoFd = go[1];

  benchmark::Initialize(&argc, argv);
  benchmark::RunSpecifiedBenchmarks();
  benchmark::Shutdown();

  int status = 0;
  ::waitpid(client, &status, 0);
  std::error_code ignored;
  std::filesystem::remove_all(gRoot, ignored);
  return WIFEXITED(status) && WEXITSTATUS(status) == 0 ? 0 : 1;
}
