// The database's plug-in cache: plug-in UUID to the daemon's plug-in object,
// so that repeated look-ups of one plug-in share one object. It holds no
// order of use: a purge drops every entry at once.
//
// Thread safety: confined to the queue given at construction (the
// database's "QVDatabase" queue); every member but approximateCount()
// asserts it. approximateCount() may be read from any thread and serves
// logs only.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <unordered_map>

#include "platform/dispatch/SerialQueue.h"
#include "platform/values/Uuid.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

class QVDPlugInCache {
 public:
  explicit QVDPlugInCache(std::shared_ptr<platform::dispatch::SerialQueue> queue)
      : queue_(std::move(queue)) {}
  QVDPlugInCache(const QVDPlugInCache&) = delete;
  QVDPlugInCache& operator=(const QVDPlugInCache&) = delete;

  // The entry of `uuid` when it is still valid. An entry that is no longer
  // valid is dropped, and none is answered.
  std::shared_ptr<QVDPlugIn> validEntry(const platform::Uuid& uuid);
  // Stores `plugIn` under its uuid, replacing an entry there. A plug-in
  // without a uuid is not stored.
  void store(std::shared_ptr<QVDPlugIn> plugIn);
  // Drops the entry of `uuid`; false when there was none.
  bool remove(const platform::Uuid& uuid);
  // Empties the cache when it holds more than `limit` entries; true when it
  // did. There is no partial trim: the whole cache goes.
  bool purgeToLimit(std::uint64_t limit);

  std::size_t count() const;
  // The count as last written on the queue, for logs outside it.
  std::size_t approximateCount() const { return approximateCount_.load(); }

  const std::shared_ptr<platform::dispatch::SerialQueue>& queue() const { return queue_; }

 private:
  void noteCount() { approximateCount_.store(entries_.size()); }

  const std::shared_ptr<platform::dispatch::SerialQueue> queue_;
  std::unordered_map<platform::Uuid, std::shared_ptr<QVDPlugIn>, platform::UuidHash> entries_;
  std::atomic<std::size_t> approximateCount_{0};
};

}  // namespace qvd
