// The requests of one connection still waiting for their replies, by message
// id, each with the handler that gets the reply or the connection's error.
//
// Thread safety: none; the connection guards it with its mutex.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <map>
#include <memory>
#include <optional>
#include <vector>

#include "platform/dispatch/Queue.h"
#include "platform/mbx/Message.h"
#include "platform/values/Result.h"

namespace platform::mbx::internal {

struct PendingReply {
  // Where the handler runs; null runs it on the connection's delivery queue
  // right away (used by synchronous waiters, which only signal).
  std::shared_ptr<dispatch::Queue> queue;
  std::function<void(platform::Result<Message>)> handler;

  // Who completes: a reader that returns to the pool right after (the
  // handler's queue then waits for that thread instead of waking another),
  // or any other code.
  enum class Caller { Anyone, ReturnsToPool };

  // Hands `outcome` to the handler on its queue.
  void complete(platform::Result<Message> outcome, Caller caller = Caller::Anyone) &&;
};

class PendingReplies {
 public:
  std::size_t size() const { return entries_.size(); }

  // REQUIRES: `id` is not pending yet.
  void add(std::uint64_t id, PendingReply reply);
  // The entry for `id`, removed; none when no request with that id waits.
  std::optional<PendingReply> take(std::uint64_t id);
  // Every entry, oldest request first, leaving none.
  std::vector<PendingReply> takeAll();

 private:
  std::map<std::uint64_t, PendingReply> entries_;
};

}  // namespace platform::mbx::internal
