// The registration service: which plug-ins (and the applications holding
// them) are installed, persisted across restarts. Registering a bundle path
// reads its Info.vmap, merges in its extension point's SDK dictionary and
// stores the record; every change makes a new generation UUID so that
// callers can tell cheaply whether anything they cached may be stale.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <functional>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "platform/holvane/RegistrationRecord.h"
#include "platform/holvane/SdkRegistry.h"
#include "platform/values/Result.h"

namespace platform::holvane {

enum class FilterVerdict { Keep, Skip };

// Called once for every record a filtered query would return.
using RecordFilter = std::function<FilterVerdict(const PlugInRecord&)>;
// Called with a record just stored (install) or about to be removed
// (uninstall).
using RecordObserver = std::function<void(const PlugInRecord&)>;

// What a start-up pass did.
struct ScanSummary {
  std::size_t registered = 0;  // bundles stored (new or changed)
  std::size_t unchanged = 0;   // bundles already stored as they are
  std::size_t refused = 0;     // bundles that could not be registered (logged)
  std::size_t dropped = 0;     // records whose bundle is gone
};

class Registry : public SdkRegistry {
 public:
  ~Registry() override = default;

  // Registers (or refreshes) the plug-in bundle at `bundlePath`, which may
  // be given with a trailing separator or through links. Refused, with the
  // reason logged and returned, when the bundle has no readable Info.vmap,
  // no XOExtension dictionary, no identifier, or lies outside an
  // application without being on the system volume.
  virtual Result<PlugInRecord> registerPlugIn(std::string_view bundlePath) = 0;
  // Removes the record of `bundlePath` (NotFound when there is none). The
  // path need not exist any more.
  virtual Status unregisterPlugIn(std::string_view bundlePath) = 0;

  virtual Result<std::optional<PlugInRecord>> plugInByUuid(const Uuid& uuid) const = 0;
  virtual Result<std::optional<PlugInRecord>> plugInByPath(std::string_view bundlePath) const = 0;
  virtual Result<std::vector<PlugInRecord>> allPlugIns() const = 0;
  // The plug-ins whose containing application is at `applicationPath`.
  virtual Result<std::vector<PlugInRecord>> plugInsOfApplication(
      std::string_view applicationPath) const = 0;
  virtual Result<std::optional<ApplicationRecord>> applicationByPath(
      std::string_view applicationPath) const = 0;

  // The records of extension point `extensionPointName` (every record when
  // none) that `filter` keeps; `filter` is called once per such record.
  virtual Result<std::vector<PlugInRecord>> queryPlugIns(
      const std::optional<std::string>& extensionPointName, const RecordFilter& filter) const = 0;

  // Changes whenever the database does; persisted with it.
  virtual Uuid generation() const = 0;

  // Observers live as long as the registry. See the implementation for the
  // queue they run on.
  virtual void addInstallObserver(RecordObserver observer) = 0;
  virtual void addUninstallObserver(RecordObserver observer) = 0;

  // Registers every plug-in in the system and application locations and
  // drops the records whose bundle is gone.
  virtual Result<ScanSummary> scanInstalledBundles() = 0;
};

}  // namespace platform::holvane
