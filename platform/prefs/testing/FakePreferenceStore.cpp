#include "platform/prefs/testing/FakePreferenceStore.h"

#include <utility>

#include "platform/prefs/internal/DomainName.h"

namespace platform::prefs {

void FakePreferenceStore::setValue(std::string_view domain, std::string_view key, Value value) {
  std::lock_guard<std::mutex> lock(mu_);
  auto found = domains_.find(domain);
  if (found == domains_.end()) found = domains_.emplace(std::string(domain), Dictionary()).first;
  found->second.set(key, std::move(value));
}

void FakePreferenceStore::setDomain(std::string_view domain, Dictionary preferences) {
  std::lock_guard<std::mutex> lock(mu_);
  domains_.insert_or_assign(std::string(domain), std::move(preferences));
}

void FakePreferenceStore::removeDomain(std::string_view domain) {
  std::lock_guard<std::mutex> lock(mu_);
  if (auto found = domains_.find(domain); found != domains_.end()) domains_.erase(found);
}

Value FakePreferenceStore::valueForKey(std::string_view domain, std::string_view key) const {
  if (!internal::isValidDomainName(domain)) return Value();
  std::lock_guard<std::mutex> lock(mu_);
  auto found = domains_.find(domain);
  return found != domains_.end() ? found->second.get(key) : Value();
}

}  // namespace platform::prefs
