// Connections whose read watching a synchronous request switched off, and
// that were left that way when the request ended ("parked"). A client that
// sends synchronous requests one after another then pays for switching the
// watching off and on only once, not twice per request. A parked
// connection's watching is switched back on by a sweep that runs once it has
// been idle for kParkGrace, so unsolicited input (a goodbye, the peer's
// close) is still delivered, at most about twice that late.
//
// Thread safety: safe from any thread.
#pragma once

#include <chrono>
#include <memory>
#include <mutex>
#include <vector>

#include "platform/dispatch/SerialQueue.h"

namespace platform::mbx {
class Connection;
}

namespace platform::mbx::internal {

class ReadParking {
 public:
  static constexpr std::chrono::milliseconds kParkGrace{2};

  static ReadParking& instance();

  // Remembers `connection` until a sweep finds it idle for kParkGrace (or
  // gone, or no longer parked).
  void park(std::weak_ptr<Connection> connection);

 private:
  ReadParking();
  void sweep();
  void scheduleSweepLocked();

  std::mutex mu_;
  std::vector<std::weak_ptr<Connection>> parked_;  // guarded by mu_
  bool sweepScheduled_ = false;                     // guarded by mu_
  const std::shared_ptr<dispatch::SerialQueue> queue_;
};

}  // namespace platform::mbx::internal
