// Installation: registering and deregistering bundles on a client's behalf,
// and following what the registration service installs and uninstalls.
#include <string>

#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "qvd/QVDatabase.h"

namespace qvd {

std::optional<platform::Error> QVDatabase::addPlugIn(std::string_view url) {
  const std::optional<std::string> path = QVPathFromFileURL(url);
  platform::Result<platform::holvane::PlugInRecord> registered =
      path ? registry_->registerPlugIn(*path)
           : platform::Result<platform::holvane::PlugInRecord>(
                 platform::Error::posix(EINVAL, "not a file URL"));
  if (registered.ok()) return std::nullopt;
  QVLogHV().info("registration of %@ refused: %@", url, registered.error());
  return QVErrorWithCodeMessage(QVErrorRegistryFailure, "Holvane failed to register the plug-in");
}

std::optional<platform::Error> QVDatabase::removePlugIn(std::string_view url) {
  const std::optional<std::string> path = QVPathFromFileURL(url);
  const platform::Status removed =
      path ? registry_->unregisterPlugIn(*path) : platform::Status(platform::Error::posix(EINVAL));
  if (removed.ok()) return std::nullopt;
  QVLogHV().info("deregistration of %@ refused: %@", url, removed.error());
  return QVErrorWithCodeMessage(QVErrorRegistryFailure, "Holvane failed to deregister the plug-in");
}

void QVDatabase::observeInstallations() {
  // The daemon builds a new plug-in's object when a look-up first asks for
  // it, so an install is only logged.
  registry_->addInstallObserver(
      [](const platform::holvane::PlugInRecord& record) { pluginsDidInstall({record}); });
  // The observers outlive nothing they borrow: both hold the cache weakly.
  std::weak_ptr<QVDPlugInCache> weakCache = cache_;
  std::weak_ptr<DelegateSlot> weakDelegate = delegate_;
  registry_->addUninstallObserver(
      [weakCache, weakDelegate](const platform::holvane::PlugInRecord& record) {
        pluginsWillUninstall({record}, weakCache, weakDelegate);
      });
}

void QVDatabase::pluginsDidInstall(const std::vector<platform::holvane::PlugInRecord>& records) {
  for (const platform::holvane::PlugInRecord& record : records) {
    QVLogOps().notice("plug-in INSTALLED:%@ %@(%@) %{public}@ %@",
                      record.bundleIdentifier.value_or(""), record.identifier,
                      record.version.value_or(""), record.uuid.toString(), record.path);
  }
}

void QVDatabase::pluginsWillUninstall(const std::vector<platform::holvane::PlugInRecord>& records,
                                      const std::weak_ptr<QVDPlugInCache>& weakCache,
                                      const std::weak_ptr<DelegateSlot>& weakDelegate) {
  const std::shared_ptr<QVDPlugInCache> cache = weakCache.lock();
  if (!cache) return;
  // The registry runs its observers on its own queue, and the database
  // queue calls into the registry (a look-up by UUID runs there); waiting
  // on the database queue from the registry's would risk each waiting on
  // the other, so the drop is queued instead. It still runs before any
  // look-up submitted after the notice.
  cache->queue()->async([weakCache, weakDelegate, records] {
    if (auto alive = weakCache.lock()) {
      for (const platform::holvane::PlugInRecord& record : records) {
        QVLogOps().notice("plug-in UNINSTALLED:%@ %@(%@) %{public}@ %@",
                          record.bundleIdentifier.value_or(""), record.identifier,
                          record.version.value_or(""), record.uuid.toString(), record.path);
        alive->remove(record.uuid);
      }
    }
    // The delegate is told after the drop: it only starts the termination
    // of the plug-ins' processes, whose replies and wait run on queues of
    // their own, so nothing waits on this queue.
    const std::shared_ptr<DelegateSlot> slot = weakDelegate.lock();
    std::shared_ptr<QVDatabaseDelegate> delegate;
    if (slot) {
      std::lock_guard<std::mutex> lock(slot->mu);
      delegate = slot->delegate.lock();
    }
    if (delegate) delegate->removedPlugIns(records);
  });
}

}  // namespace qvd
