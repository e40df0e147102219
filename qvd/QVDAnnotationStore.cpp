#include "qvd/QVDAnnotationStore.h"

#include <unistd.h>

#include <cerrno>
#include <filesystem>
#include <system_error>
#include <utility>

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "platform/log/Format.h"
#include "platform/root/Root.h"
#include "qvd/QVDAnnotationConstants.h"

namespace qvd {
namespace {

// The daemon is often started from a service manager whose working
// directory is "/", but a relative -d must still name the file the user
// meant when started by hand.
std::string absolutePath(std::string path) {
  if (!path.empty() && path.front() == '/') return path;
  std::error_code ec;
  std::filesystem::path cwd = std::filesystem::current_path(ec);
  if (ec) return path;  // loading and saving then report the relative path
  return (cwd / path).string();
}

}  // namespace

QVDAnnotationStore::QVDAnnotationStore(std::string path, platform::vmap::FileOps& ops)
    : path_(std::move(path)), ops_(ops) {}

std::string QVDAnnotationStore::globalPath() {
  return platform::rootPath("var/db/Quorvex-Annotations");
}

platform::Result<std::string> QVDAnnotationStore::containerPath(
    platform::container::ContainerManager& containers) {
  return containers.userContainer(::getuid(), QVDContainerIdentifier);
}

std::string QVDAnnotationStore::annotationsURL() const {
  if (path_.empty() || path_.front() != '/') return path_;
  return QVFileURLFromPath(path_);
}

platform::Result<std::unique_ptr<QVDAnnotationStore>> QVDAnnotationStore::initWithDatabase(
    std::optional<std::string> path,
    std::shared_ptr<platform::container::ContainerManager> containers,
    platform::vmap::FileOps& ops) {
  std::unique_ptr<QVDAnnotationStore> store(
      new QVDAnnotationStore(path ? absolutePath(std::move(*path)) : defaultDatabasePath(), ops));

  platform::Status loaded = store->loadDb(store->path_);
  if (loaded.ok()) return store;
  // Only the code is compared: whichever layer read the file, a first start
  // without one is normal and not worth a line in the log.
  if (loaded.error().code() != QVDFileNotFoundErrorCode)
    QVLogOps().error("unable to load annotation database:%{public}@ error:%{public}@ (resetting)",
                     store->annotationsURL(), loaded.error());

  platform::Result<std::string> container =
      containers ? containerPath(*containers)
                 : platform::Result<std::string>(
                       platform::Error::posix(EINVAL, "no container manager"));
  if (!container.ok()) {
    const auto number = static_cast<unsigned long long>(container.error().code());
    QVLogOps().error("failed to get storage container: error=%llu", number);
    return platform::Error(container.error().domain(), container.error().code(),
                           platform::log::formatMessage(
                               platform::log::Redaction::Off,
                               "unable to locate user container: error %llu", number));
  }

  // The container is a directory, so reading it as a file fails on any
  // ordinary file system and the store starts empty; the attempt is kept so
  // that a table placed there is still picked up.
  if (store->loadDb(*container).ok()) {
    QVLogOps().info("migrating shared annotations");
    if (platform::Status saved = store->saveDb(); !saved.ok())
      QVLogOps().error("unable to save migrated annotations to %{public}@ error:%{public}@",
                       store->annotationsURL(), saved.error());
  }
  return store;
}

std::optional<platform::Dictionary> QVDAnnotationStore::annotationForIdentifier(
    std::string_view key) const {
  platform::Value stored;  // shares the annotation's storage: the copy is cheap
  {
    std::lock_guard lock(tableMu_);
    const platform::Value* found = table_.find(key);
    if (found == nullptr) return std::nullopt;
    stored = *found;
  }
  const platform::Dictionary* annotation = stored.dictionary();
  if (annotation == nullptr) {
    // The file is not checked entry by entry; a foreign value reads as none.
    QVLogOps().debug("annotation of %{public}s is not a dictionary: %@", std::string(key),
                     stored);
    return std::nullopt;
  }
  return *annotation;
}

std::optional<platform::Dictionary> QVDAnnotationStore::annotationForPlugIn(
    const QVDAnnotated& plugIn) const {
  return annotationForIdentifier(plugIn.annotationKey());
}

void QVDAnnotationStore::setAnnotationForPlugIn(std::optional<platform::Dictionary> annotation,
                                                const QVDAnnotated& plugIn) {
  const std::string key = plugIn.annotationKey();
  std::lock_guard write(writeMu_);
  {
    std::lock_guard lock(tableMu_);
    if (!annotation) {
      table_.remove(key);
    } else {
      // Stored values are immutable and shared with readers, so the merge
      // builds a new dictionary rather than changing the stored one.
      platform::Dictionary merged;
      if (const platform::Value* stored = table_.find(key); stored && stored->dictionary())
        merged = *stored->dictionary();
      for (const auto& [entry, value] : *annotation) merged.set(entry, value);
      table_.set(key, platform::Value(std::move(merged)));
    }
  }
  if (platform::Status saved = saveHoldingWriteLock(); !saved.ok())
    QVLogOps().error("unable to save annotations:%{public}@ error:%{public}@", annotationsURL(),
                     saved.error());
}

platform::Dictionary QVDAnnotationStore::annotations() const {
  std::lock_guard lock(tableMu_);
  return table_;
}

}  // namespace qvd
