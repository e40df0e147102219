// The daemon's preferences, from the domain "com.corvane.quorvex.userprefs".
// Every read goes to the store afresh, so an administrator's change applies
// to the next request without a restart.
//
// Thread safety: safe from any queue (the store is).
#pragma once

#include <memory>

#include "platform/prefs/PreferenceStore.h"
#include "platform/values/Value.h"

namespace qvd {

class QVDUserPrefs {
 public:
  // REQUIRES: store is not null.
  explicit QVDUserPrefs(std::shared_ptr<const platform::prefs::PreferenceStore> store);

  // The value of "exclusions" as it is now; none when unset or unreadable.
  platform::Value exclusions() const;

 private:
  const std::shared_ptr<const platform::prefs::PreferenceStore> store_;
};

}  // namespace qvd
