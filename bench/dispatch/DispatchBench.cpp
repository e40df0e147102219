// What a sync round trip costs next to the cheapest ways of doing the same
// thing by hand: a function call (what an inline sync should stay close to)
// and a mutex+condvar ping-pong between two threads (what a sync that has to
// hop threads should stay close to). Each sync benchmark prints its ratio to
// both as the counters vs_call and vs_pingpong.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <atomic>
#include <chrono>
#include <condition_variable>
#include <mutex>
#include <thread>

#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/SerialQueue.h"

namespace {

using platform::dispatch::SerialQueue;
using Clock = std::chrono::steady_clock;

__attribute__((noinline)) void plainFunction(int* counter) {
  ++*counter;
  benchmark::ClobberMemory();
}

// Two threads handing a turn back and forth under one mutex.
class PingPong {
 public:
  PingPong()
      : partner_([this] {
          std::unique_lock<std::mutex> lock(mu_);
          for (;;) {
            cv_.wait(lock, [this] { return turn_ != 0; });
            if (turn_ < 0) return;
            turn_ = 0;
            cv_.notify_all();
          }
        }) {}
  ~PingPong() {
    {
      std::lock_guard<std::mutex> lock(mu_);
      turn_ = -1;
    }
    cv_.notify_all();
    partner_.join();
  }
  void roundTrip() {
    std::unique_lock<std::mutex> lock(mu_);
    turn_ = 1;
    cv_.notify_all();
    cv_.wait(lock, [this] { return turn_ == 0; });
  }

 private:
  std::mutex mu_;
  std::condition_variable cv_;
  int turn_ = 0;  // 1: the partner's turn, 0: ours, -1: stop
  std::thread partner_;
};

template <class F>
double nanosPerOp(int ops, F&& f) {
  auto start = Clock::now();
  for (int i = 0; i < ops; ++i) f();
  return std::chrono::duration<double, std::nano>(Clock::now() - start).count() / ops;
}

// Median of a few timed runs. Measured afresh by every benchmark, just
// before its timed loop, so that a ratio compares runs made under the same
// machine load.
struct Baselines {
  double callNs;
  double pingPongNs;
};
Baselines measureBaselines() {
  auto median = [](auto&& measure) {
    double runs[5];
    for (double& r : runs) r = measure();
    std::sort(std::begin(runs), std::end(runs));
    return runs[2];
  };
  int counter = 0;
  double call = median([&] { return nanosPerOp(2'000'000, [&] { plainFunction(&counter); }); });
  PingPong pp;
  double ping = median([&] { return nanosPerOp(5'000, [&] { pp.roundTrip(); }); });
  return Baselines{call, ping};
}

void reportRatios(benchmark::State& state, const Baselines& base, Clock::duration elapsed) {
  double ns = std::chrono::duration<double, std::nano>(elapsed).count() /
              static_cast<double>(std::max<benchmark::IterationCount>(state.iterations(), 1));
  state.counters["ns_per_op"] = ns;
  state.counters["vs_call"] = ns / base.callNs;
  state.counters["vs_pingpong"] = ns / base.pingPongNs;
}

void BM_PlainFunctionCall(benchmark::State& state) {
  const Baselines base = measureBaselines();
  int counter = 0;
  auto start = Clock::now();
  for (auto _ : state) plainFunction(&counter);
  reportRatios(state, base, Clock::now() - start);
}
BENCHMARK(BM_PlainFunctionCall);

void BM_MutexCondvarPingPong(benchmark::State& state) {
  const Baselines base = measureBaselines();
  PingPong pp;
  auto start = Clock::now();
  for (auto _ : state) pp.roundTrip();
  reportRatios(state, base, Clock::now() - start);
}
BENCHMARK(BM_MutexCondvarPingPong)->UseRealTime();

// From serial queue A onto idle serial queue B: runs inline, no hop.
void BM_SyncOntoIdleSerialQueue(benchmark::State& state) {
  const Baselines base = measureBaselines();
  auto a = SerialQueue::create("bench.a");
  auto b = SerialQueue::create("bench.b");
  int counter = 0;
  a->sync([&] {
    auto start = Clock::now();
    for (auto _ : state) b->sync([&] { plainFunction(&counter); });
    reportRatios(state, base, Clock::now() - start);
  });
}
BENCHMARK(BM_SyncOntoIdleSerialQueue);

// From serial queue A onto serial queue B while B is busy: the work is
// queued, a pool thread runs it and wakes the caller. B's earlier item
// spins until the sync is queued, so every iteration really hops.
void BM_SyncOntoBusySerialQueue(benchmark::State& state) {
  const Baselines base = measureBaselines();
  auto a = SerialQueue::create("bench.a");
  auto b = SerialQueue::create("bench.b");
  int counter = 0;
  a->sync([&] {
    auto start = Clock::now();
    for (auto _ : state) {
      b->async([&] {
        while (b->pendingCountForTesting() == 0) {
        }
      });
      b->sync([&] { plainFunction(&counter); });
    }
    reportRatios(state, base, Clock::now() - start);
  });
}
BENCHMARK(BM_SyncOntoBusySerialQueue)->UseRealTime();

// Items through one serial queue, posted from outside it.
void BM_AsyncThroughputOneSerialQueue(benchmark::State& state) {
  constexpr int kBatch = 10'000;
  auto queue = SerialQueue::create("bench.throughput");
  std::atomic<long> ran{0};
  for (auto _ : state) {
    for (int i = 0; i < kBatch; ++i) {
      queue->async([&ran] { ran.fetch_add(1, std::memory_order_relaxed); });
    }
    queue->sync([] {});  // in order: everything before it has run
  }
  state.SetItemsProcessed(state.iterations() * kBatch);
  if (ran.load() != state.iterations() * kBatch) state.SkipWithError("lost items");
}
BENCHMARK(BM_AsyncThroughputOneSerialQueue)->UseRealTime()->Unit(benchmark::kMillisecond);

}  // namespace

BENCHMARK_MAIN();
