// The main queue: a serial queue served by the process's main thread inside
// runMainLoop(). Work posted before the loop starts is kept and runs, in
// order, once it does. The daemon's main() ends by calling runMainLoop()
// and never returns from it; tests quit the loop with quitMainLoop().
//
// Thread safety: async(), sync() and quitMainLoop() are safe from any
// thread; runMainLoop() belongs to the main thread.
#pragma once

#include <condition_variable>
#include <deque>
#include <memory>
#include <mutex>

#include "platform/dispatch/Queue.h"

namespace platform::dispatch {
namespace internal {
class SyncWaiter;
}

class MainQueue final : public Queue {
 public:
  // The process's main queue, labelled "qv.main". It is never destroyed.
  static std::shared_ptr<MainQueue> instance();

  void async(Closure work) override;
  // Enqueues `work` and waits until the main loop has run it.
  // REQUIRES: !isCurrent(), and the caller is not the main thread outside
  //           the loop (nobody could ever serve it); both abort.
  void sync(Closure work) override;

  // See runMainLoop() and quitMainLoop() below.
  void run();
  void quit();

 private:
  struct Item {
    Closure work;
    internal::SyncWaiter* waiter = nullptr;
  };

  MainQueue();

  std::mutex mu_;
  std::condition_variable cv_;
  std::deque<Item> items_;
  bool running_ = false;
  bool quitRequested_ = false;
};

// Runs the main queue's items on the calling thread until quitMainLoop().
// REQUIRES: the caller is the process's main thread and not already inside
//           the loop (both abort).
void runMainLoop();

// Makes the running runMainLoop() (or, if none runs, the next one) return
// once the item it is running has finished. Items not yet run stay queued.
void quitMainLoop();

}  // namespace platform::dispatch
