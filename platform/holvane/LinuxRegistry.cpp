#include "platform/holvane/LinuxRegistry.h"

#include <errno.h>
#include <stdio.h>
#include <sys/stat.h>
#include <time.h>

#include <algorithm>
#include <type_traits>

#include "platform/dispatch/ScopedBlockingCall.h"
#include "platform/holvane/RegistryError.h"
#include "platform/holvane/internal/HolvaneLog.h"
#include "platform/holvane/internal/RecordStore.h"

namespace platform::holvane {
namespace {

using internal::holvaneLog;

// Stored records differ from fresh ones only by time when nothing changed.
bool sameContent(const PlugInRecord& stored, const PlugInRecord& fresh) {
  PlugInRecord comparable = fresh;
  comparable.uuid = stored.uuid;
  comparable.originalIdentifier = stored.originalIdentifier;
  comparable.registered = stored.registered;
  return comparable == stored;
}

Status makeDirectories(const std::string& root, std::string_view relative) {
  std::string path = root;
  std::size_t start = 0;
  while (start < relative.size()) {
    std::size_t end = relative.find('/', start);
    if (end == std::string_view::npos) end = relative.size();
    path += "/";
    path += relative.substr(start, end - start);
    start = end + 1;
    if (::mkdir(path.c_str(), 0755) != 0 && errno != EEXIST) {
      return Error::posix(errno, "mkdir " + path);
    }
  }
  return okStatus();
}

// Moves a damaged database (and SQLite's side files) out of the way, keeping
// it for whoever wants to find out what happened.
void moveAside(const std::string& path) {
  dispatch::ScopedBlockingCall blocking;
  const std::string aside = path + ".corrupt-" + std::to_string(::time(nullptr));
  if (::rename(path.c_str(), aside.c_str()) != 0 && errno != ENOENT) {
    const int err = errno;
    holvaneLog().error("cannot move %{public}@ aside: %{errno}d; removing it", path, err);
    (void)::unlink(path.c_str());
  }
  for (const char* suffix : {"-journal", "-wal", "-shm"}) (void)::unlink((path + suffix).c_str());
}

}  // namespace

struct LinuxRegistry::Batch {
  internal::Transaction transaction;
  std::size_t changes = 0;
  std::vector<PlugInRecord> installed;  // told to the observers at commit
};

template <typename Work>
auto LinuxRegistry::onQueue(Work&& work) const -> decltype(work()) {
  using Answer = decltype(work());
  if (queue_->isCurrent()) return work();
  if constexpr (std::is_void_v<Answer>) {
    queue_->sync([&] { work(); });
  } else {
    std::optional<Answer> result;
    queue_->sync([&] { result.emplace(work()); });
    return std::move(*result);
  }
}

LinuxRegistry::LinuxRegistry(RegistryLocations locations, std::shared_ptr<const SdkRegistry> sdks,
                             std::shared_ptr<const codesign::EntitlementStore> entitlements,
                             ScanLimits limits)
    : locations_(std::move(locations)),
      sdks_(std::move(sdks)),
      entitlements_(std::move(entitlements)),
      builder_(locations_, *sdks_, *entitlements_),
      scan_(locations_, limits),
      changesPerTransaction_(std::max<std::size_t>(1, limits.changesPerTransaction)),
      queue_(dispatch::SerialQueue::create("com.corvane.holvane")) {}

LinuxRegistry::~LinuxRegistry() {
  // The store must close on its queue, after any work still running there.
  if (!queue_->isCurrent()) queue_->sync([this] { store_.reset(); });
}

Result<std::shared_ptr<LinuxRegistry>> LinuxRegistry::open(
    RegistryLocations locations, std::shared_ptr<const SdkRegistry> sdks,
    std::shared_ptr<const codesign::EntitlementStore> entitlements, StartupScan scan,
    ScanLimits limits) {
  std::shared_ptr<LinuxRegistry> registry(
      new LinuxRegistry(std::move(locations), std::move(sdks), std::move(entitlements), limits));
  Result<StoreFile> file = registry->onQueue([&] { return registry->openStore(); });
  if (!file.ok()) return file.error();
  if (scan == StartupScan::Run || *file == StoreFile::Rebuilt) {
    Result<ScanSummary> scanned = registry->scanInstalledBundles();
    if (!scanned.ok()) return scanned.error();
  }
  return registry;
}

Result<LinuxRegistry::StoreFile> LinuxRegistry::openStore() {
  QV_ASSERT_ON_QUEUE(queue_);
  if (Status made = makeDirectories(locations_.root, "var/db/holvane"); !made.ok()) {
    return made.error();
  }
  const std::string path = locations_.database();
  StoreFile file = StoreFile::Existing;
  Result<std::unique_ptr<internal::RecordStore>> store = internal::RecordStore::open(path);
  if (!store.ok() && !isRegistryError(store.error(), RegistryErrorCode::Corrupt)) {
    // A full or failing disk says nothing about the file, and moving it
    // aside would drop the write-ahead log with the changes committed
    // there. The file is as good as before once the disk recovers.
    holvaneLog().error("cannot open registration database %{public}@: %{public}@", path,
                       store.error());
    return store.error();
  }
  if (!store.ok()) {
    holvaneLog().fault("registration database %{public}@ unusable, rebuilding it: %{public}@",
                       path, store.error());
    moveAside(path);
    file = StoreFile::Rebuilt;
    store = internal::RecordStore::open(path);
    if (!store.ok()) return store.error();
  }
  store_ = std::move(store).value();
  Result<std::optional<Uuid>> stored = store_->generation();
  if (!stored.ok()) return stored.error();
  if (*stored) {
    std::lock_guard<std::mutex> lock(generationMu_);
    generation_ = **stored;
  } else if (Status first = storeChange([] { return okStatus(); }); !first.ok()) {
    return first.error();
  }
  return file;
}

Status LinuxRegistry::storeChange(const std::function<Status()>& change) {
  QV_ASSERT_ON_QUEUE(queue_);
  if (batch_) {
    if (Status changed = change(); !changed.ok()) return changed;
    ++batch_->changes;
    return okStatus();
  }
  Result<internal::Transaction> transaction = store_->begin();
  if (!transaction.ok()) return transaction.error();
  if (Status changed = change(); !changed.ok()) return changed;
  const Uuid next = Uuid::generate();
  if (Status set = store_->setGeneration(next); !set.ok()) return set;
  if (Status committed = transaction->commit(); !committed.ok()) return committed;
  std::lock_guard<std::mutex> lock(generationMu_);
  generation_ = next;
  return okStatus();
}

Result<LinuxRegistry::Registered> LinuxRegistry::registerOnQueue(std::string_view bundlePath) {
  QV_ASSERT_ON_QUEUE(queue_);
  Result<internal::BuiltRecords> built = builder_.build(bundlePath);
  if (!built.ok()) {
    holvaneLog().error("%{public}@", built.error());
    return built.error();
  }
  PlugInRecord& record = built->plugIn;
  Result<std::optional<PlugInRecord>> existing = store_->plugInByPath(record.path);
  if (!existing.ok()) return existing.error();
  std::optional<ApplicationRecord> newApplication;
  if (built->application) {
    Result<std::optional<ApplicationRecord>> known =
        store_->applicationByPath(built->application->path);
    if (!known.ok()) return known.error();
    if (!*known) newApplication = std::move(built->application);
  }
  if (*existing) {
    if (!newApplication && sameContent(**existing, record)) {
      return Registered{std::move(**existing), Outcome::Unchanged};
    }
    record.uuid = (*existing)->uuid;
    record.originalIdentifier = (*existing)->originalIdentifier;
  } else {
    record.uuid = Uuid::generate();
    record.originalIdentifier = record.identifier;
  }
  Status stored = storeChange([&]() -> Status {
    if (newApplication) {
      if (Status put = store_->putApplication(*newApplication); !put.ok()) return put;
    }
    return store_->putPlugIn(record);
  });
  if (!stored.ok()) {
    holvaneLog().error("cannot store %{public}@: %{public}@", record.path, stored.error());
    return stored.error();
  }
  holvaneLog().info("registered %{public}@ as %{public}@", record.path, record.identifier);
  noteInstalled(record);
  return Registered{std::move(record), Outcome::Stored};
}

void LinuxRegistry::noteInstalled(const PlugInRecord& record) {
  QV_ASSERT_ON_QUEUE(queue_);
  if (batch_) {
    batch_->installed.push_back(record);
    return;
  }
  for (const RecordObserver& observer : installObservers_) observer(record);
}

Status LinuxRegistry::beginBatch() {
  QV_ASSERT_ON_QUEUE(queue_);
  Result<internal::Transaction> transaction = store_->begin();
  if (!transaction.ok()) return transaction.error();
  batch_.reset(new Batch{std::move(transaction).value(), 0, {}});
  return okStatus();
}

Status LinuxRegistry::commitBatch() {
  QV_ASSERT_ON_QUEUE(queue_);
  const std::unique_ptr<Batch> batch = std::move(batch_);
  if (batch->changes == 0) return okStatus();  // rolled back: nothing to store
  const Uuid next = Uuid::generate();
  if (Status set = store_->setGeneration(next); !set.ok()) return set;
  if (Status committed = batch->transaction.commit(); !committed.ok()) return committed;
  {
    std::lock_guard<std::mutex> lock(generationMu_);
    generation_ = next;
  }
  for (const PlugInRecord& record : batch->installed) {
    for (const RecordObserver& observer : installObservers_) observer(record);
  }
  return okStatus();
}

Status LinuxRegistry::removeOnQueue(const PlugInRecord& record) {
  QV_ASSERT_ON_QUEUE(queue_);
  for (const RecordObserver& observer : uninstallObservers_) observer(record);
  Status removed = storeChange([&] { return store_->removePlugIn(record.path); });
  if (removed.ok()) holvaneLog().info("unregistered %{public}@", record.path);
  return removed;
}

Result<PlugInRecord> LinuxRegistry::registerPlugIn(std::string_view bundlePath) {
  return onQueue([&]() -> Result<PlugInRecord> {
    Result<Registered> registered = registerOnQueue(bundlePath);
    if (!registered.ok()) return registered.error();
    return std::move(registered->record);
  });
}

Status LinuxRegistry::unregisterPlugIn(std::string_view bundlePath) {
  return onQueue([&]() -> Status {
    const std::optional<std::string> path = internal::canonicalBundlePath(bundlePath);
    Result<std::optional<PlugInRecord>> existing =
        path ? store_->plugInByPath(*path) : std::optional<PlugInRecord>();
    if (!existing.ok()) return existing.error();
    if (!*existing) {
      return registryError(RegistryErrorCode::NotFound,
                           "no plug-in registered at " + std::string(bundlePath));
    }
    return removeOnQueue(**existing);
  });
}

Result<std::optional<PlugInRecord>> LinuxRegistry::plugInByUuid(const Uuid& uuid) const {
  return onQueue([&] { return store_->plugInByUuid(uuid); });
}

Result<std::optional<PlugInRecord>> LinuxRegistry::plugInByPath(std::string_view bundlePath) const {
  return onQueue([&]() -> Result<std::optional<PlugInRecord>> {
    const std::optional<std::string> path = internal::canonicalBundlePath(bundlePath);
    if (!path) return std::optional<PlugInRecord>();
    return store_->plugInByPath(*path);
  });
}

Result<std::vector<PlugInRecord>> LinuxRegistry::allPlugIns() const {
  return onQueue([&] { return store_->allPlugIns(); });
}

Result<std::vector<PlugInRecord>> LinuxRegistry::plugInsOfApplication(
    std::string_view applicationPath) const {
  return onQueue([&]() -> Result<std::vector<PlugInRecord>> {
    const std::optional<std::string> path = internal::canonicalBundlePath(applicationPath);
    if (!path) return std::vector<PlugInRecord>();
    return store_->plugInsOfApplication(*path);
  });
}

Result<std::optional<ApplicationRecord>> LinuxRegistry::applicationByPath(
    std::string_view applicationPath) const {
  return onQueue([&]() -> Result<std::optional<ApplicationRecord>> {
    const std::optional<std::string> path = internal::canonicalBundlePath(applicationPath);
    if (!path) return std::optional<ApplicationRecord>();
    return store_->applicationByPath(*path);
  });
}

Result<std::vector<PlugInRecord>> LinuxRegistry::queryPlugIns(
    const std::optional<std::string>& extensionPointName, const RecordFilter& filter) const {
  // Read under the queue, filter outside it: the filter is the caller's
  // code and may take its time or ask the registry again.
  Result<std::vector<PlugInRecord>> candidates = onQueue([&] {
    return extensionPointName ? store_->plugInsOfExtensionPoint(*extensionPointName)
                              : store_->allPlugIns();
  });
  if (!candidates.ok() || !filter) return candidates;
  std::vector<PlugInRecord> kept;
  for (PlugInRecord& record : *candidates) {
    if (filter(record) == FilterVerdict::Keep) kept.push_back(std::move(record));
  }
  return kept;
}

Uuid LinuxRegistry::generation() const {
  std::lock_guard<std::mutex> lock(generationMu_);
  return generation_;
}

void LinuxRegistry::addInstallObserver(RecordObserver observer) {
  onQueue([&] { installObservers_.push_back(std::move(observer)); });
}

void LinuxRegistry::addUninstallObserver(RecordObserver observer) {
  onQueue([&] { uninstallObservers_.push_back(std::move(observer)); });
}

Result<ScanSummary> LinuxRegistry::scanInstalledBundles() {
  return onQueue([&] { return scanOnQueue(); });
}

Result<ScanSummary> LinuxRegistry::scanOnQueue() {
  QV_ASSERT_ON_QUEUE(queue_);
  ScanSummary summary;
  ScanCandidates candidates = scan_.candidates();
  for (const Error& problem : candidates.problems) {
    holvaneLog().error("start-up registration skips a directory: %{public}@", problem);
  }
  // One transaction per plug-in would cost a commit each; a pass over
  // thousands of bundles stores them in batches instead. A failure rolls
  // back only the open batch.
  if (Status begun = beginBatch(); !begun.ok()) return begun.error();
  auto batchFull = [&]() -> Status {
    if (batch_->changes < changesPerTransaction_) return okStatus();
    if (Status committed = commitBatch(); !committed.ok()) return committed;
    return beginBatch();
  };
  for (const std::string& path : candidates.plugInPaths) {
    Result<Registered> registered = registerOnQueue(path);
    if (!registered.ok()) {
      // A refusal is the bundle's fault and is logged; a storage failure
      // would fail every later bundle too.
      if (!isRegistryError(registered.error(), RegistryErrorCode::Refused)) {
        batch_.reset();
        return registered.error();
      }
      ++summary.refused;
    } else if (registered->outcome == Outcome::Stored) {
      ++summary.registered;
    } else {
      ++summary.unchanged;
    }
    if (Status next = batchFull(); !next.ok()) {
      batch_.reset();
      return next.error();
    }
  }
  Result<std::vector<PlugInRecord>> stored = store_->allPlugIns();
  if (!stored.ok()) {
    batch_.reset();
    return stored.error();
  }
  for (const PlugInRecord& record : *stored) {
    struct stat status {};
    if (::stat((record.path + "/Info.vmap").c_str(), &status) == 0) continue;
    if (errno != ENOENT && errno != ENOTDIR) continue;  // not known to be gone
    Status removed = removeOnQueue(record);
    if (removed.ok()) removed = batchFull();
    if (!removed.ok()) {
      batch_.reset();
      return removed.error();
    }
    ++summary.dropped;
  }
  if (Status committed = commitBatch(); !committed.ok()) return committed.error();
  holvaneLog().notice("registration pass: %d stored, %d unchanged, %d refused, %d dropped",
                      summary.registered, summary.unchanged, summary.refused, summary.dropped);
  return summary;
}

Result<std::optional<Dictionary>> LinuxRegistry::sdkDictionary(
    std::string_view extensionPointIdentifier) const {
  return sdks_->sdkDictionary(extensionPointIdentifier);
}

}  // namespace platform::holvane
