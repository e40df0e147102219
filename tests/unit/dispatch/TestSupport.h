// Helpers shared by the dispatch tests.
#pragma once

#include <chrono>
#include <functional>
#include <string>
#include <thread>

#include "platform/dispatch/FdSource.h"
#include "platform/dispatch/Semaphore.h"
#include "platform/dispatch/internal/ThreadPool.h"

namespace platform::dispatch::testing {

using namespace std::chrono_literals;

// Polls `done` until it holds or `limit` passes; answers whether it held.
inline bool eventually(const std::function<bool()>& done, std::chrono::milliseconds limit = 5s) {
  auto deadline = std::chrono::steady_clock::now() + limit;
  while (!done()) {
    if (std::chrono::steady_clock::now() > deadline) return false;
    std::this_thread::sleep_for(1ms);
  }
  return true;
}

// "prefix<n>". (Spelled out: g++ 12 at -O3 warns falsely on "literal" + string.)
inline std::string numbered(const char* prefix, int n) {
  std::string s = prefix;
  s += std::to_string(n);
  return s;
}

// Cancels `source` and returns once its cancel handler (which runs `then`)
// has run, that is once no handler of it runs any more.
inline bool cancelAndWait(const std::shared_ptr<FdSource>& source,
                          std::function<void()> then = nullptr) {
  auto done = std::make_shared<Semaphore>();
  source->setCancelHandler([done, then = std::move(then)] {
    if (then) then();
    done->signal();
  });
  source->cancel();
  return done->waitFor(std::chrono::seconds(10)) == WaitResult::Succeeded;
}

// Changes the pool's limits for one test and puts them back after.
class ScopedPoolLimits {
 public:
  explicit ScopedPoolLimits(internal::PoolLimits limits)
      : saved_(internal::ThreadPool::instance().limits()) {
    internal::ThreadPool::instance().setLimitsForTesting(limits);
  }
  ~ScopedPoolLimits() { internal::ThreadPool::instance().setLimitsForTesting(saved_); }

 private:
  internal::PoolLimits saved_;
};

}  // namespace platform::dispatch::testing
