#include "platform/dispatch/Semaphore.h"

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/dispatch/internal/Fatal.h"

namespace platform::dispatch {

Semaphore::Semaphore(std::int64_t initial) : count_(initial) {
  if (initial < 0)
    internal::fatal("semaphore created with a negative count (%lld)",
                    static_cast<long long>(initial));
}

Semaphore::~Semaphore() {
  std::lock_guard<std::mutex> lock(mu_);
  if (waiters_ != 0) internal::fatal("semaphore destroyed while %d thread(s) wait on it", waiters_);
}

void Semaphore::signal() {
  std::lock_guard<std::mutex> lock(mu_);
  ++count_;
  if (waiters_ > 0) cv_.notify_one();
}

void Semaphore::wait() {
  std::unique_lock<std::mutex> lock(mu_);
  if (count_ == 0) {
    // Only a wait that really blocks is marked: the pool should not grow
    // for a semaphore that is already available.
    lock.unlock();
    ScopedBlockingCall blocking;
    lock.lock();
    ++waiters_;
    cv_.wait(lock, [this] { return count_ > 0; });
    --waiters_;
  }
  --count_;
}

WaitResult Semaphore::waitFor(std::chrono::nanoseconds timeout) {
  auto deadline = std::chrono::steady_clock::now() + timeout;
  std::unique_lock<std::mutex> lock(mu_);
  if (count_ == 0) {
    lock.unlock();
    ScopedBlockingCall blocking;
    lock.lock();
    ++waiters_;
    bool acquired = cv_.wait_until(lock, deadline, [this] { return count_ > 0; });
    --waiters_;
    if (!acquired) return WaitResult::TimedOut;
  }
  --count_;
  return WaitResult::Succeeded;
}

}  // namespace platform::dispatch
