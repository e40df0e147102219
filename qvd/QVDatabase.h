// The plug-in database: the daemon's view of which plug-ins exist. The
// registration service is the source of truth; the database turns its
// records into plug-in objects and keeps them in a cache keyed by plug-in
// UUID, so that repeated look-ups of one plug-in share one object. It also
// owns the annotation store. The server is a database (it derives from this
// class) extended with the network-facing service.
//
// The cache is emptied when it has grown past the cache limit at the moment
// of a creation, after every change of the current locale (names are
// localized), and loses a plug-in's entry when that plug-in is uninstalled.
//
// Thread safety: the look-ups and settings may be called from any queue
// except the database's own ("QVDatabase"), which they wait on; the cache
// is confined to that queue.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>
#include <unordered_set>
#include <vector>

#include "Quorvex/QVPlugInCore.h"
#include "platform/dispatch/SerialQueue.h"
#include "platform/holvane/RegistrationRecord.h"
#include "platform/holvane/Registry.h"
#include "platform/notify/NotificationCenter.h"
#include "platform/notify/ObservationHandle.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"
#include "platform/values/Uuid.h"
#include "qvd/Platform.h"
#include "qvd/QVDAnnotationStore.h"
#include "qvd/QVDPlugIn.h"
#include "qvd/QVDPlugInCache.h"

namespace qvd {

// Plug-ins as a set: members are equal when their UUIDs are.
using QVDLentRecords = std::vector<std::shared_ptr<const platform::holvane::PlugInRecord>>;
using QVDPlugInSet =
    std::unordered_set<std::shared_ptr<QVDPlugIn>, QVPlugInCoreHash, QVPlugInCoreEqual>;

// The election list of a query: the normalised "XOUserElection" value, or
// none (no election filtering). A list with an element that cannot be
// normalised, a text that cannot, and any other kind give none.
std::optional<std::vector<std::string>> electionListFromQuery(const platform::Dictionary& query);
// One element: "=x" gives "x"; a text starting with a letter, mark or
// number stands for itself; anything else (and "") fails.
std::optional<std::string> normalizedElection(const platform::Value& element);
// The integer of an election value: reals are truncated toward zero, and a
// value that is no number (or a real out of range) counts as 0.
std::int64_t electionInteger(const platform::Value& election);
// The election key of a value: its integer's low 8 bits, unsigned, in
// decimal ("255" for -1).
std::string electionKey(const platform::Value& election);

// Told by the database of plug-ins being uninstalled. The server is the
// database's delegate and ends the plug-ins' running processes.
class QVDatabaseDelegate {
 public:
  virtual ~QVDatabaseDelegate() = default;
  // Called once the records' cache entries are gone, on the database's
  // queue: an implementation must return at once and must not wait on that
  // queue.
  virtual void removedPlugIns(const std::vector<platform::holvane::PlugInRecord>& records) = 0;
};

class QVDatabase {
 public:
  virtual ~QVDatabase();
  QVDatabase(const QVDatabase&) = delete;
  QVDatabase& operator=(const QVDatabase&) = delete;

  // ---- The cache (QVDatabase.cpp) ----

  // The cached plug-in of `record`, else a new one (then cached). None when
  // the record yields no plug-in; nothing is cached then.
  // REQUIRES: not on syncQueue().
  std::shared_ptr<QVDPlugIn> plugInForProxy(const platform::holvane::PlugInRecord& record);
  // A new plug-in built from `record`, stored in the cache after the purge
  // rule has been applied; none (cache untouched) when it cannot be built.
  // REQUIRES: on syncQueue().
  std::shared_ptr<QVDPlugIn> createPlugInForProxy(const platform::holvane::PlugInRecord& record);
  // Empties the cache when it holds more than `limit` entries.
  // REQUIRES: on syncQueue().
  void purgeCachesToLimit(std::uint64_t limit);
  // Gives a plug-in carrying the auto-elect entitlement the election 1,
  // unless it has a non-zero election already.
  // REQUIRES: on syncQueue().
  void autoElect(const QVDPlugIn& plugIn);
  // The number of cached plug-ins (waits on syncQueue()).
  std::size_t cacheCount() const;

  // ---- The queries (QVDatabaseQueries.cpp) ----

  // The plug-ins the registration service selects for `query`, narrowed by
  // the user's elections when the query's "XOUserElection" asks for it.
  // An absent or empty query lists every plug-in, ignoring elections.
  // None when the service answered no list. When `lent` is given, it
  // receives the registration records the plug-ins were found with, and
  // each plug-in borrows its own (QVDPlugIn::lendRecord): while the caller
  // keeps them and the registration database stays unchanged, the plug-ins
  // read these rather than fetching their records again.
  std::optional<QVDPlugInSet> findPlugIns(const std::optional<platform::Dictionary>& query,
                                          QVDLentRecords* lent = nullptr);
  // The plug-in with `uuid`, or none.
  virtual std::shared_ptr<QVDPlugIn> findPlugIn(const platform::Uuid& uuid);
  // The plug-in whose bundle lies at the file URL `url`, or none.
  virtual std::shared_ptr<QVDPlugIn> findPlugInAtPath(std::string_view url);
  // The plug-ins inside the application at the file URL `url`, in the
  // service's order; none (not an empty list) when it has none.
  std::optional<std::vector<std::shared_ptr<QVDPlugIn>>> plugInsWithinApplication(
      std::string_view url);

  // ---- Installation (QVDatabaseInstallation.cpp) ----

  // Has the registration service register (or deregister) the bundle at
  // the file URL `url`. None on success, else a code-2 error. Runs on the
  // caller's queue and leaves the cache alone: it follows the service's
  // uninstall notices and the next look-ups.
  std::optional<platform::Error> addPlugIn(std::string_view url);
  std::optional<platform::Error> removePlugIn(std::string_view url);

  // ---- Annotations (QVDatabaseAnnotations.cpp) ----

  // The plug-in's stored annotation, or none. REQUIRES: not on syncQueue().
  std::optional<platform::Dictionary> annotationForPlugIn(const QVDPlugIn& plugIn) const;
  // Merges `annotation` into the stored one (none removes it) and saves
  // before returning, so concurrent changes are applied and written one at a
  // time. A failed save is logged by the store, not reported.
  // REQUIRES: not on syncQueue().
  void setAnnotationForPlugIn(std::optional<platform::Dictionary> annotation,
                              const QVDPlugIn& plugIn);
  // Tells other processes that annotations (or holds) changed. A failed
  // post is logged.
  void notifyAnnotationChange() const;

  // ---- Settings ----

  // A creation that finds more than this many cached plug-ins empties the
  // cache first. -c sets it at start.
  void setCacheLimit(std::uint64_t limit) { cacheLimit_.store(limit); }
  std::uint64_t cacheLimit() const { return cacheLimit_.load(); }

  // The annotation file given with -d; none means the default location.
  const std::optional<std::string>& databasePath() const { return databasePath_; }

  // The annotation store, made by initDatabase().
  QVDAnnotationStore& annotationStore() const { return *annotations_; }

  // The database's own serial queue, "QVDatabase".
  const std::shared_ptr<platform::dispatch::SerialQueue>& syncQueue() const { return sync_; }

  // ---- Delegate (QVDatabase.cpp) ----

  // Held weakly; read each time it is called.
  void setDelegate(std::weak_ptr<QVDatabaseDelegate> delegate);
  std::shared_ptr<QVDatabaseDelegate> delegate() const;

  static constexpr std::uint64_t kDefaultCacheLimit = 1000000;

 protected:
  QVDatabase();
  // The database part of the server's construction: loads the annotation
  // store from `databasePath` (none: its default location), then observes
  // the registration service's uninstalls and the locale. Fails when no
  // annotation location can be had at all (the user container lookup), or
  // when a service the database needs is missing. A locale that cannot be
  // observed is logged only.
  platform::Status initDatabase(std::optional<std::string> databasePath, const Platform& services);

 private:
  struct DelegateSlot;
  // Logs what the registration service installed, and drops what it is
  // about to uninstall from the cache before telling the delegate.
  void observeInstallations();
  static void pluginsDidInstall(const std::vector<platform::holvane::PlugInRecord>& records);
  static void pluginsWillUninstall(const std::vector<platform::holvane::PlugInRecord>& records,
                                   const std::weak_ptr<QVDPlugInCache>& cache,
                                   const std::weak_ptr<DelegateSlot>& delegate);
  // Runs on sync_: the valid cached entry of `uuid`, else the key is
  // dropped and none answered.
  std::shared_ptr<QVDPlugIn> cachedOnQueue(const platform::Uuid& uuid);

  std::optional<std::string> databasePath_;
  std::unique_ptr<QVDAnnotationStore> annotations_;
  std::atomic<std::uint64_t> cacheLimit_{kDefaultCacheLimit};
  const std::shared_ptr<platform::dispatch::SerialQueue> sync_;
  // Shared with the observers, which hold it weakly: a notice that arrives
  // after the database is gone finds nothing to change.
  const std::shared_ptr<QVDPlugInCache> cache_;
  std::shared_ptr<platform::holvane::Registry> registry_;
  std::shared_ptr<platform::notify::NotificationCenter> notifications_;
  QVDPlugIn::Services plugInServices_;
  platform::notify::ObservationHandle regionObserver_;
  // The delegate, shared with the uninstall observer (which holds it
  // weakly, as it does the cache).
  struct DelegateSlot {
    mutable std::mutex mu;
    std::weak_ptr<QVDatabaseDelegate> delegate;  // guarded by mu
  };
  const std::shared_ptr<DelegateSlot> delegate_ = std::make_shared<DelegateSlot>();
};

}  // namespace qvd
