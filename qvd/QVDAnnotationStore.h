// The annotation store: every plug-in's annotation (the user's election and
// the values clients keep per plug-in), held in memory, read from one file
// when the daemon starts and written whole after every change.
//
// Thread safety: safe from any thread. The table has a mutex of its own that
// is never held during file input or output, so a read (the election filter
// reads from the registration service's thread) never waits for a save.
// Changes, loads and saves are serialised by a second mutex, so the file
// always ends with the latest table; the owner still makes changes from one
// queue so that their order is its own.
#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/container/ContainerManager.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"
#include "platform/vmap/FileOps.h"
#include "qvd/QVDAnnotated.h"

namespace qvd {

class QVDAnnotationStore {
 public:
  // Loads the table from `path` (a file; relative paths are taken from the
  // working directory), or from defaultDatabasePath() when none is given. A
  // file that is missing, unreadable, unparsable or of another version gives
  // an empty table (logged, except when missing) after the daemon's user
  // container has been tried as a migration source. The one error returned
  // is a failed container lookup: the daemon cannot run without a usable
  // annotation location, and the error's description is the text to stop
  // with; a null `containers` counts as a failed lookup. `containers` is
  // consulted only during this call.
  // REQUIRES: `ops` outlives the store.
  static platform::Result<std::unique_ptr<QVDAnnotationStore>> initWithDatabase(
      std::optional<std::string> path,
      std::shared_ptr<platform::container::ContainerManager> containers,
      platform::vmap::FileOps& ops = platform::vmap::FileOps::real());

  QVDAnnotationStore(const QVDAnnotationStore&) = delete;
  QVDAnnotationStore& operator=(const QVDAnnotationStore&) = delete;

  // "<root>/var/db/Quorvex-Annotations"; the default is the global file.
  static std::string globalPath();
  static std::string defaultDatabasePath() { return globalPath(); }
  // The daemon's per-user container directory (made when missing).
  static platform::Result<std::string> containerPath(
      platform::container::ContainerManager& containers);

  // Where the table is written, as a path and as a file URL.
  const std::string& annotationsPath() const { return path_; }
  std::string annotationsURL() const;

  // The annotation stored under `key`, or none.
  std::optional<platform::Dictionary> annotationForIdentifier(std::string_view key) const;
  std::optional<platform::Dictionary> annotationForPlugIn(const QVDAnnotated& plugIn) const;

  // Merges `annotation` into the plug-in's stored one (each entry replaces
  // the stored value of its key whole; other stored entries stay), or with
  // none removes the plug-in's annotation; then saves. A failed save is
  // logged and otherwise ignored: the change stays in memory and the next
  // successful save writes it.
  void setAnnotationForPlugIn(std::optional<platform::Dictionary> annotation,
                              const QVDAnnotated& plugIn);

  // Replaces the table with the one in the file at `path`. Fails, leaving
  // the table as it was, when the file cannot be read (a missing file with
  // QVDFileNotFoundErrorCode), is not a vmap document, or is of another
  // version (QVErrorVersionMismatch).
  platform::Status loadDb(const std::string& path);
  // Writes the whole table to annotationsPath(), atomically and durably.
  // The parent directory must exist.
  platform::Status saveDb();

  // A copy of the whole table: annotation key to annotation.
  platform::Dictionary annotations() const;

 private:
  QVDAnnotationStore(std::string path, platform::vmap::FileOps& ops);

  // REQUIRES: writeMu_ held.
  platform::Status saveHoldingWriteLock();

  const std::string path_;
  platform::vmap::FileOps& ops_;  // borrowed
  // Serialises changes, loads and saves; taken before tableMu_.
  std::mutex writeMu_;
  mutable std::mutex tableMu_;
  platform::Dictionary table_;  // guarded by tableMu_
};

}  // namespace qvd
