// Construction, the cache and automatic election of the plug-in database.
#include "qvd/QVDatabase.h"

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDAnnotationConstants.h"

namespace qvd {

QVDatabase::QVDatabase()
    : sync_(platform::dispatch::SerialQueue::create("QVDatabase")),
      cache_(std::make_shared<QVDPlugInCache>(sync_)) {}

QVDatabase::~QVDatabase() = default;

platform::Status QVDatabase::initDatabase(std::optional<std::string> databasePath,
                                          const Platform& services) {
  if (!services.registry || !services.locale || !services.extensions ||
      !services.notifications) {
    return QVErrorWithCodeMessage(QVErrorInvalidRequest,
                                  "the plug-in database needs the registration, locale, "
                                  "notification and sandbox extension services");
  }
  databasePath_ = databasePath;
  auto store = QVDAnnotationStore::initWithDatabase(std::move(databasePath), services.containers);
  if (!store.ok()) return store.error();
  annotations_ = std::move(store).value();
  registry_ = services.registry;
  notifications_ = services.notifications;
  plugInServices_ = {services.registry,       services.locale,
                     services.extensions,     services.types,
                     services.serviceManager, services.consents};

  observeInstallations();
  std::weak_ptr<QVDPlugInCache> weakCache = cache_;

  // Names are localized when a plug-in object is built, so a new locale
  // makes every cached object stale. The notice is delivered on the
  // database queue itself, where the purge must run anyway.
  auto observation =
      services.locale->observeChanges(sync_, [weakCache](const std::string& /*locale*/) {
        QVLogOps().notice("locale change detected; purging cache");
        if (auto cache = weakCache.lock()) cache->purgeToLimit(0);
      });
  if (observation.ok()) {
    regionObserver_ = std::move(observation).value();
  } else {
    // A system without a locale configuration directory still serves; its
    // cached names simply stay in the locale they were made in.
    QVLogOps().error("cannot observe locale changes: %{public}@", observation.error());
  }
  return platform::Status();
}

std::shared_ptr<QVDPlugIn> QVDatabase::cachedOnQueue(const platform::Uuid& uuid) {
  QV_ASSERT_ON_QUEUE(sync_);
  return cache_->validEntry(uuid);
}

std::shared_ptr<QVDPlugIn> QVDatabase::plugInForProxy(
    const platform::holvane::PlugInRecord& record) {
  std::shared_ptr<QVDPlugIn> found;
  sync_->sync([&] {
    // The nil UUID is what a record made without one holds.
    if (record.uuid.isNull()) {
      if (QVInternalDiagnostics()) {
        QVLogOps().fault("Expected pluginUUID to be non-nil.");
      } else {
        QVLogOps().error("Expected pluginUUID to be non-nil.");
      }
      return;
    }
    found = cachedOnQueue(record.uuid);
    if (!found) found = createPlugInForProxy(record);
  });
  return found;
}

std::shared_ptr<QVDPlugIn> QVDatabase::createPlugInForProxy(
    const platform::holvane::PlugInRecord& record) {
  QV_ASSERT_ON_QUEUE(sync_);
  QVLogOps().notice("createPlugInForProxy");
  if (!plugInServices_.registry) return nullptr;  // initDatabase() did not succeed
  std::shared_ptr<QVDPlugIn> plugIn = QVDPlugIn::initWithHVData(record, plugInServices_);
  if (!plugIn) return nullptr;
  if (plugIn->hasEntitlement(QVAutoElectEntitlement)) autoElect(*plugIn);
  purgeCachesToLimit(cacheLimit());
  cache_->store(plugIn);
  return plugIn;
}

void QVDatabase::purgeCachesToLimit(std::uint64_t limit) {
  QV_ASSERT_ON_QUEUE(sync_);
  // The registration service keeps no schema caches in process, so the
  // cache's own entries are all there is to drop.
  cache_->purgeToLimit(limit);
}

void QVDatabase::autoElect(const QVDPlugIn& plugIn) {
  QV_ASSERT_ON_QUEUE(sync_);
  if (!annotations_) return;
  platform::Dictionary annotation =
      annotations_->annotationForPlugIn(plugIn).value_or(platform::Dictionary());
  if (const platform::Value* election = annotation.find(QVAnnotationElectionKey)) {
    // An election the user made (or -1, "never") is kept; only 0 or none
    // is raised.
    if (electionInteger(*election) != 0) return;
  }
  annotation.set(QVAnnotationElectionKey, platform::Value(1));
  annotations_->setAnnotationForPlugIn(std::move(annotation), plugIn);
}

void QVDatabase::setDelegate(std::weak_ptr<QVDatabaseDelegate> delegate) {
  std::lock_guard<std::mutex> lock(delegate_->mu);
  delegate_->delegate = std::move(delegate);
}

std::shared_ptr<QVDatabaseDelegate> QVDatabase::delegate() const {
  std::lock_guard<std::mutex> lock(delegate_->mu);
  return delegate_->delegate.lock();
}

std::size_t QVDatabase::cacheCount() const {
  std::size_t count = 0;
  sync_->sync([&] { count = cache_->count(); });
  return count;
}

}  // namespace qvd
