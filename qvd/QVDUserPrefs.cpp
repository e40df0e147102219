#include "qvd/QVDUserPrefs.h"

#include "Quorvex/QVDConstants.h"

namespace qvd {

QVDUserPrefs::QVDUserPrefs(std::shared_ptr<const platform::prefs::PreferenceStore> store)
    : store_(std::move(store)) {}

platform::Value QVDUserPrefs::exclusions() const {
  return store_->valueForKey(QVPreferenceDomain, QVExclusionsPreferenceKey);
}

}  // namespace qvd
