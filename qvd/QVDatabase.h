// The plug-in database: the daemon's view of which plug-ins exist, with a
// cache of their records and the annotation store. The server is a database
// (it derives from this class) extended with the network-facing service.
//
// For now this is the shell the server stands on: it keeps its settings
// (annotation file location, cache limit) and its own serial queue, and knows
// no plug-ins; the registry fills in the look-ups.
//
// Thread safety: the look-ups and settings may be called from any queue;
// the cache is confined to the database's own queue ("QVDatabase").
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_map>

#include "platform/dispatch/SerialQueue.h"
#include "platform/values/Result.h"
#include "platform/values/Uuid.h"
#include "platform/container/ContainerManager.h"
#include "qvd/QVDAnnotationStore.h"
#include "qvd/QVDPlugIn.h"

namespace qvd {

class QVDatabase {
 public:
  virtual ~QVDatabase();
  QVDatabase(const QVDatabase&) = delete;
  QVDatabase& operator=(const QVDatabase&) = delete;

  // The plug-in with `uuid`, or none.
  virtual std::shared_ptr<const QVDPlugIn> findPlugIn(const platform::Uuid& uuid);
  // The plug-in whose bundle lies at the file URL `url`, or none.
  virtual std::shared_ptr<const QVDPlugIn> findPlugInAtPath(std::string_view url);

  // The number of plug-in records the cache may hold. -c sets it at start.
  void setCacheLimit(std::uint64_t limit) { cacheLimit_.store(limit); }
  std::uint64_t cacheLimit() const { return cacheLimit_.load(); }

  // The annotation file given with -d; none means the default location.
  const std::optional<std::string>& databasePath() const { return databasePath_; }

  // The annotation store, made by initDatabase().
  QVDAnnotationStore& annotationStore() const { return *annotations_; }

  // The database's own serial queue, "QVDatabase".
  const std::shared_ptr<platform::dispatch::SerialQueue>& syncQueue() const { return sync_; }

  // Makes `plugIn` known to the look-ups, until the registry provides them.
  // A null plug-in, or one without uuid or path, is ignored.
  void addPlugInForTesting(std::shared_ptr<const QVDPlugIn> plugIn);

  static constexpr std::uint64_t kDefaultCacheLimit = 1000000;

 protected:
  QVDatabase();
  // The database part of the server's construction: loads the annotation
  // store from `databasePath` (none: its default location). Fails only when
  // no annotation location can be had at all (the user container lookup).
  platform::Status initDatabase(std::optional<std::string> databasePath,
                                std::shared_ptr<platform::container::ContainerManager> containers);

 private:
  std::optional<std::string> databasePath_;
  std::unique_ptr<QVDAnnotationStore> annotations_;
  std::atomic<std::uint64_t> cacheLimit_{kDefaultCacheLimit};
  const std::shared_ptr<platform::dispatch::SerialQueue> sync_;
  // Touched only on sync_.
  std::unordered_map<std::string, std::shared_ptr<const QVDPlugIn>> byUuid_;
  std::unordered_map<std::string, std::shared_ptr<const QVDPlugIn>> byPath_;
};

}  // namespace qvd
