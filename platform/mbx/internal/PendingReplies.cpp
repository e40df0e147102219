#include "platform/mbx/internal/PendingReplies.h"

#include <cassert>

namespace platform::mbx::internal {

void PendingReply::complete(Result<Message> outcome, Caller caller) && {
  if (!handler) return;
  if (!queue) {
    handler(std::move(outcome));
    return;
  }
  dispatch::Closure work([handler = std::move(handler), outcome = std::move(outcome)]() mutable {
    handler(std::move(outcome));
  });
  if (caller == Caller::ReturnsToPool) {
    queue->asyncAfterCaller(std::move(work));
  } else {
    queue->async(std::move(work));
  }
}

void PendingReplies::add(std::uint64_t id, PendingReply reply) {
  [[maybe_unused]] bool inserted = entries_.emplace(id, std::move(reply)).second;
  assert(inserted);
}

std::optional<PendingReply> PendingReplies::take(std::uint64_t id) {
  auto it = entries_.find(id);
  if (it == entries_.end()) return std::nullopt;
  PendingReply reply = std::move(it->second);
  entries_.erase(it);
  return reply;
}

std::vector<PendingReply> PendingReplies::takeAll() {
  std::vector<PendingReply> all;
  all.reserve(entries_.size());
  for (auto& [id, reply] : entries_) all.push_back(std::move(reply));
  entries_.clear();
  return all;
}

}  // namespace platform::mbx::internal
