// A NotificationCenter in memory, for tests of code that posts or observes:
// counts live in this object, and post() runs the callbacks of the name's
// observers before it returns (inline when the observer's queue is already
// current, else through a sync onto it). The same names are refused as by
// the real center.
//
// Thread safety: safe from any thread. Callbacks run without the fake's lock
// held, so they may post or observe.
#pragma once

#include <cstdint>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include "platform/notify/NotificationCenter.h"

namespace platform::notify {

class FakeNotificationCenter final : public NotificationCenter {
 public:
  Status post(std::string_view name) override;
  Result<std::uint64_t> currentCount(std::string_view name) const override;
  Result<ObservationHandle> observe(std::string_view name, std::shared_ptr<dispatch::Queue> queue,
                                    NotificationCallback callback) override;

  // Observations of `name` not yet cancelled.
  std::size_t observerCountForTesting(std::string_view name) const;

 private:
  struct Observation {
    std::uint64_t id;
    std::shared_ptr<dispatch::Queue> queue;
    std::shared_ptr<const NotificationCallback> callback;
  };

  // Shared with the handles, which may outlive the fake.
  struct State {
    mutable std::mutex mu;
    std::map<std::string, std::uint64_t, std::less<>> counts;
    std::map<std::string, std::vector<Observation>, std::less<>> observers;
    std::uint64_t nextId = 1;
  };
  const std::shared_ptr<State> state_ = std::make_shared<State>();
};

}  // namespace platform::notify
