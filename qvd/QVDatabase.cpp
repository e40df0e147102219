#include "qvd/QVDatabase.h"

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"

namespace qvd {

QVDatabase::QVDatabase() : sync_(platform::dispatch::SerialQueue::create("QVDatabase")) {}

QVDatabase::~QVDatabase() = default;

platform::Status QVDatabase::initDatabase(
    std::optional<std::string> databasePath,
    std::shared_ptr<platform::container::ContainerManager> containers) {
  databasePath_ = databasePath;
  auto store = QVDAnnotationStore::initWithDatabase(std::move(databasePath), std::move(containers));
  if (!store.ok()) return store.error();
  annotations_ = std::move(store).value();
  return platform::Status();
}

std::shared_ptr<const QVDPlugIn> QVDatabase::findPlugIn(const platform::Uuid& uuid) {
  std::shared_ptr<const QVDPlugIn> found;
  sync_->sync([&] {
    auto it = byUuid_.find(uuid.toString());
    if (it != byUuid_.end()) found = it->second;
  });
  return found;
}

std::shared_ptr<const QVDPlugIn> QVDatabase::findPlugInAtPath(std::string_view url) {
  std::optional<std::string> path = QVPathFromFileURL(url);
  if (!path) {
    QVLogTraffic().info("not a file URL: %{public}s", std::string(url));
    return nullptr;
  }
  std::shared_ptr<const QVDPlugIn> found;
  sync_->sync([&] {
    auto it = byPath_.find(*path);
    if (it != byPath_.end()) found = it->second;
  });
  return found;
}

void QVDatabase::addPlugInForTesting(std::shared_ptr<const QVDPlugIn> plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn ? plugIn->uuid() : std::nullopt;
  const std::optional<std::string> path = plugIn ? plugIn->path() : std::nullopt;
  // A built plug-in always has both; anything else cannot be looked up.
  if (!uuid || !path) return;
  sync_->sync([&] {
    byUuid_[uuid->toString()] = plugIn;
    byPath_[*path] = plugIn;
  });
}

}  // namespace qvd
