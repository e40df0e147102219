#include "qvd/QVDUserPrefs.h"

#include <string>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"

namespace qvd {

QVDUserPrefs::QVDUserPrefs(std::shared_ptr<const platform::prefs::PreferenceStore> store)
    : store_(std::move(store)) {}

platform::Value QVDUserPrefs::exclusions() const {
  // No cache of our own: the store answers what the file holds now.
  return store_->valueForKey(QVPreferenceDomain, QVExclusionsPreferenceKey);
}

std::vector<platform::Dictionary> QVDUserPrefs::exclusionRuleSets() const {
  const platform::Value value = exclusions();
  std::vector<platform::Dictionary> ruleSets;
  if (value.isNone()) return ruleSets;
  const platform::Array* list = value.array();
  if (list == nullptr) {
    QVLogOps().debug("exclusions ignored: a %{public}s, not a list of rule sets",
                     std::string(platform::valueTypeName(value.type())));
    return ruleSets;
  }
  platform::Array ignored;
  for (const platform::Value& entry : *list) {
    if (const platform::Dictionary* rules = entry.dictionary()) {
      ruleSets.push_back(*rules);
    } else {
      ignored.append(entry);
    }
  }
  if (!ignored.empty()) {
    const auto count = static_cast<unsigned>(ignored.size());
    QVLogOps().debug("exclusions ignored: %u entries that are not rule sets: %@", count,
                     platform::Value(std::move(ignored)));
  }
  return ruleSets;
}

}  // namespace qvd
