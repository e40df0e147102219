#include "qvd/QVDPlugInCache.h"

#include "Quorvex/QVLog.h"

namespace qvd {

std::shared_ptr<QVDPlugIn> QVDPlugInCache::validEntry(const platform::Uuid& uuid) {
  QV_ASSERT_ON_QUEUE(queue_);
  auto it = entries_.find(uuid);
  if (it == entries_.end()) return nullptr;
  if (it->second && it->second->isStillValid()) return it->second;
  entries_.erase(it);
  noteCount();
  return nullptr;
}

void QVDPlugInCache::store(std::shared_ptr<QVDPlugIn> plugIn) {
  QV_ASSERT_ON_QUEUE(queue_);
  const std::optional<platform::Uuid> uuid = plugIn ? plugIn->uuid() : std::nullopt;
  if (!uuid) return;
  entries_.insert_or_assign(*uuid, std::move(plugIn));
  noteCount();
}

bool QVDPlugInCache::remove(const platform::Uuid& uuid) {
  QV_ASSERT_ON_QUEUE(queue_);
  const bool removed = entries_.erase(uuid) > 0;
  noteCount();
  return removed;
}

bool QVDPlugInCache::purgeToLimit(std::uint64_t limit) {
  QV_ASSERT_ON_QUEUE(queue_);
  const std::size_t count = entries_.size();
  if (count <= limit) return false;
  QVLogOps().info("purging cache for %d > %d", count, limit);
  entries_.clear();
  noteCount();
  return true;
}

std::size_t QVDPlugInCache::count() const {
  QV_ASSERT_ON_QUEUE(queue_);
  return entries_.size();
}

}  // namespace qvd
