// Preferences on disk: one vmap file per domain,
// <root>/etc/quorvex/preferences/<domain>.vmap, holding a dictionary. Every
// question looks at the file afresh (a stat, and a read when it changed; see
// internal/DomainFile.h), so an edit is seen by the next question. A
// malformed or unreadable file reads as no preferences and is logged once
// per change (category "prefs" of "com.corvane.platform").
//
// Thread safety: safe to call from any thread; calls are serialised inside.
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/prefs/PreferenceStore.h"
#include "platform/prefs/internal/DomainFile.h"
#include "platform/vmap/Reader.h"

namespace platform::prefs {

struct PreferenceLimits {
  vmap::ReadLimits file{.maxBytes = 1u << 20, .maxDepth = 32, .maxItems = 100'000};
  // Domains whose last reading is kept; past this, one is forgotten (and
  // simply read again when next asked).
  std::size_t maxCachedDomains = 64;
};

class LinuxPreferenceStore final : public PreferenceStore {
 public:
  // Domains in rootPath("etc/quorvex/preferences").
  LinuxPreferenceStore();
  // REQUIRES: directory is absolute.
  explicit LinuxPreferenceStore(std::string directory, PreferenceLimits limits = {});
  ~LinuxPreferenceStore() override;

  Value valueForKey(std::string_view domain, std::string_view key) const override;

  // Preference files read (not answered from the cache) for `domain`.
  std::size_t readsForTesting(std::string_view domain) const;

 private:
  const std::string directory_;
  const PreferenceLimits limits_;
  mutable std::mutex mu_;
  // Guarded by mu_.
  mutable std::map<std::string, std::unique_ptr<internal::DomainFile>, std::less<>> domains_;
};

}  // namespace platform::prefs
