// One observation: where and what to call, and whether it was cancelled.
// The watcher posts deliveries; each checks, when it runs, that the
// observation is still wanted.
//
// Thread safety: cancel() and deliver() are safe from any thread;
// lastCount is confined to the watcher's queue.
#pragma once

#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

#include "platform/dispatch/Queue.h"
#include "platform/notify/NotificationCenter.h"

namespace platform::notify::internal {

class Observer : public std::enable_shared_from_this<Observer> {
 public:
  Observer(std::string name, std::shared_ptr<dispatch::Queue> queue, NotificationCallback callback);

  const std::string& name() const { return name_; }

  // Posts `count` to the observer's queue; it is dropped there if the
  // observation has been cancelled by then.
  void deliver(std::uint64_t count);

  // No callback starts after this returns. The callback (and what it
  // captured) is released once no delivery is running it.
  void cancel();

  // The last count delivered or seen at start. Confined to the watcher's queue.
  std::uint64_t lastCount = 0;

 private:
  const std::string name_;
  const std::shared_ptr<dispatch::Queue> queue_;
  std::mutex mu_;
  std::shared_ptr<const NotificationCallback> callback_;  // null once cancelled
};

}  // namespace platform::notify::internal
