// Preferences: per-domain settings the daemon reads (for example how often
// it rescans, or which plug-ins an administrator turned off). Preferences
// grant nothing, so they need no trust rule; they are only read, never
// written here. LinuxPreferenceStore reads one vmap file per domain;
// testing/FakePreferenceStore answers what a test set.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <string_view>

#include "platform/values/Value.h"

namespace platform::prefs {

class PreferenceStore {
 public:
  virtual ~PreferenceStore() = default;

  // The value of `key` in `domain` as it is now: none when the key is
  // absent, when the domain has no preferences or they cannot be read, and
  // when the domain name is refused (empty, or holding "/" or "..").
  virtual Value valueForKey(std::string_view domain, std::string_view key) const = 0;
};

}  // namespace platform::prefs
