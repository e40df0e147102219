#include "platform/mbx/internal/ReadParking.h"

#include "platform/dispatch/TimerSource.h"
#include "platform/mbx/Connection.h"

namespace platform::mbx::internal {

ReadParking& ReadParking::instance() {
  static ReadParking* parking = new ReadParking();  // never destroyed: sweeps may be pending
  return *parking;
}

ReadParking::ReadParking() : queue_(dispatch::SerialQueue::create("mbx.read-parking")) {}

void ReadParking::park(std::weak_ptr<Connection> connection) {
  std::lock_guard<std::mutex> lock(mu_);
  parked_.push_back(std::move(connection));
  scheduleSweepLocked();
}

void ReadParking::scheduleSweepLocked() {
  if (sweepScheduled_) return;
  sweepScheduled_ = true;
  dispatch::after(kParkGrace, queue_, [this] { sweep(); });
}

void ReadParking::sweep() {
  std::vector<std::weak_ptr<Connection>> candidates;
  {
    std::lock_guard<std::mutex> lock(mu_);
    sweepScheduled_ = false;
    candidates.swap(parked_);
  }
  const auto now = std::chrono::steady_clock::now();
  std::vector<std::weak_ptr<Connection>> waiting;
  for (std::weak_ptr<Connection>& weak : candidates) {
    std::shared_ptr<Connection> connection = weak.lock();
    if (connection && !connection->unparkReadsIfIdle(now, kParkGrace)) {
      waiting.push_back(std::move(weak));
    }
  }
  if (waiting.empty()) return;
  std::lock_guard<std::mutex> lock(mu_);
  for (std::weak_ptr<Connection>& weak : waiting) parked_.push_back(std::move(weak));
  scheduleSweepLocked();
}

}  // namespace platform::mbx::internal
