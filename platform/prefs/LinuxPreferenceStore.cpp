#include "platform/prefs/LinuxPreferenceStore.h"

#include <utility>

#include "platform/prefs/internal/DomainName.h"
#include "platform/root/Root.h"

namespace platform::prefs {

LinuxPreferenceStore::LinuxPreferenceStore()
    : LinuxPreferenceStore(rootPath("etc/quorvex/preferences")) {}

LinuxPreferenceStore::LinuxPreferenceStore(std::string directory, PreferenceLimits limits)
    : directory_(std::move(directory)), limits_(limits) {}

LinuxPreferenceStore::~LinuxPreferenceStore() = default;

Value LinuxPreferenceStore::valueForKey(std::string_view domain, std::string_view key) const {
  if (!internal::isValidDomainName(domain)) return Value();
  std::lock_guard<std::mutex> lock(mu_);
  auto found = domains_.find(domain);
  if (found == domains_.end()) {
    if (domains_.size() >= limits_.maxCachedDomains && !domains_.empty()) {
      domains_.erase(domains_.begin());
    }
    std::string path = directory_ + "/" + std::string(domain) + ".vmap";
    found = domains_
                .emplace(std::string(domain),
                         std::make_unique<internal::DomainFile>(std::move(path), limits_.file))
                .first;
  }
  const Value& preferences = found->second->current();
  const Dictionary* dictionary = preferences.dictionary();
  return dictionary != nullptr ? dictionary->get(key) : Value();
}

std::size_t LinuxPreferenceStore::readsForTesting(std::string_view domain) const {
  std::lock_guard<std::mutex> lock(mu_);
  auto found = domains_.find(domain);
  return found == domains_.end() ? 0 : found->second->readsForTesting();
}

}  // namespace platform::prefs
