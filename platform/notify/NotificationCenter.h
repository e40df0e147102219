// System notifications: named, payload-free events any process may post and
// any may observe. Each name carries a count of the posts made so far, so an
// observer that was slow still learns the latest state. The daemon posts,
// for example, when its plug-in set changes; LinuxNotificationCenter keeps
// the counts in files, testing/FakeNotificationCenter in memory.
//
// Names are one path component: non-empty, at most 255 bytes, without "/",
// ".." or NUL (InvalidName otherwise, see NotifyError.h).
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <cstdint>
#include <functional>
#include <memory>
#include <string_view>

#include "platform/dispatch/Queue.h"
#include "platform/notify/ObservationHandle.h"
#include "platform/values/Result.h"

namespace platform::notify {

// Receives the count after a change.
using NotificationCallback = std::function<void(std::uint64_t count)>;

class NotificationCenter {
 public:
  virtual ~NotificationCenter() = default;

  // Adds one to the count of `name`, creating it (at 1) when new.
  virtual Status post(std::string_view name) = 0;

  // The number of posts of `name` so far; 0 for a name never posted.
  virtual Result<std::uint64_t> currentCount(std::string_view name) const = 0;

  // Runs `callback` on `queue` with the new count whenever the count of
  // `name` changes after this call, until the handle is cancelled. Rapid
  // posts may be coalesced into one callback, but the last count is always
  // delivered. With a serial queue, callbacks arrive in order.
  // REQUIRES: queue and callback are not null.
  virtual Result<ObservationHandle> observe(std::string_view name,
                                            std::shared_ptr<dispatch::Queue> queue,
                                            NotificationCallback callback) = 0;
};

}  // namespace platform::notify
