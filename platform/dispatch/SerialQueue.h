// A queue whose items run one at a time, in submission order. A serial queue
// owns no thread: when it has work it takes a turn on the shared pool at its
// priority, runs up to kBatchLimit items and then yields, so one busy queue
// cannot starve the others. Work still pending keeps the queue alive.
//
// sync() on an idle queue runs the work inline on the caller's thread (no
// thread hop) with the queue current; on a busy queue it enqueues the work
// behind what is pending and waits, marked as blocking. Either way, every
// queue on the caller's chain stays current inside the work.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <cstddef>
#include <deque>
#include <memory>
#include <mutex>
#include <string_view>

#include "platform/dispatch/Queue.h"

namespace platform::dispatch {
namespace internal {
class SyncWaiter;
enum class Handoff;
}  // namespace internal

class SerialQueue final : public Queue {
 public:
  static std::shared_ptr<SerialQueue> create(std::string_view label,
                                             Priority priority = Priority::Default);
  ~SerialQueue() override;

  void async(Closure work) override;
  void asyncAfterCaller(Closure work) override;
  // REQUIRES: !isCurrent() (otherwise aborts: the queue would wait on itself).
  void sync(Closure work) override;

  // Items submitted but not yet started.
  std::size_t pendingCountForTesting() const;

  // Items run in one turn on a pool thread before the queue yields.
  static constexpr int kBatchLimit = 16;

 private:
  struct Item {
    Closure work;                            // an async item
    internal::SyncWaiter* waiter = nullptr;  // or a sync caller waiting for its work
  };
  enum class State {
    Idle,           // no items, nothing running
    Scheduled,      // has items and a pending turn on the pool
    Draining,       // a pool thread is running its items
    RunningInline,  // a sync caller or an event source runs work on its own thread
  };

  SerialQueue(std::string_view label, Priority priority);
  void enqueue(Closure work, internal::Handoff handoff);
  // Gives the queue a turn on the pool; `handoff` as for ThreadPool::post.
  void schedule(internal::Handoff handoff);
  // One turn: runs up to kBatchLimit items, then yields or goes idle.
  void drain(std::shared_ptr<SerialQueue> keepAlive);
  void runItem(Item& item);
  // Ends a RunningInline turn: idle, or a turn on the pool for what came.
  void finishInline(internal::Handoff handoff);
  bool tryClaim() override;
  void runClaimed(Closure& work) override;

  mutable std::mutex mu_;
  std::deque<Item> items_;
  State state_ = State::Idle;
};

}  // namespace platform::dispatch
