// The daemon's preferences, from the domain "com.corvane.quorvex.userprefs".
// Every read goes to the store afresh (the Linux store looks at its file at
// every question), so an administrator's change applies to the next
// request without a restart.
//
// Thread safety: safe from any queue (the store is).
#pragma once

#include <memory>
#include <vector>

#include "platform/prefs/PreferenceStore.h"
#include "platform/values/Value.h"

namespace qvd {

class QVDUserPrefs {
 public:
  // REQUIRES: store is not null.
  explicit QVDUserPrefs(std::shared_ptr<const platform::prefs::PreferenceStore> store);

  // The value of "exclusions" as it is now; none when unset or unreadable.
  // Meant to be a list of rule sets: a plug-in matching any one is banned
  // for every host.
  platform::Value exclusions() const;

  // The rule sets of exclusions(), in order. A value that is not a list and
  // entries that are not dictionaries ban nothing rather than everything;
  // what was ignored is logged once per call (debug level).
  std::vector<platform::Dictionary> exclusionRuleSets() const;

 private:
  const std::shared_ptr<const platform::prefs::PreferenceStore> store_;
};

}  // namespace qvd
