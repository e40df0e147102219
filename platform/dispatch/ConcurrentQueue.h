// The shared concurrent queues, one per priority: their items run in
// parallel on the pool, in no particular order. Use one for independent work
// (hashing a file, parsing a document) that needs no ordering with other
// work; anything touching shared state belongs on a serial queue.
//
// Thread safety: all members are safe to call from any thread.
#pragma once

#include <memory>

#include "platform/dispatch/Queue.h"

namespace platform::dispatch {

class ConcurrentQueue final : public Queue {
 public:
  // The process-wide concurrent queue of `priority`, labelled
  // "qv.concurrent.<priority name>". It is never destroyed.
  static std::shared_ptr<ConcurrentQueue> shared(Priority priority = Priority::Default);

  void async(Closure work) override;
  void asyncAfterCaller(Closure work) override;
  // Runs `work` inline on the calling thread, with this queue current.
  void sync(Closure work) override;

 private:
  explicit ConcurrentQueue(Priority priority);
  // Always: items of a concurrent queue need no turn.
  bool tryClaim() override { return true; }
  void runClaimed(Closure& work) override;
};

}  // namespace platform::dispatch
