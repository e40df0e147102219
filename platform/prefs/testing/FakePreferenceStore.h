// A PreferenceStore that answers what a test set, with the same refusal of
// domain names as the real store.
//
// Thread safety: safe from any thread; setters and questions are serialised.
#pragma once

#include <map>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/prefs/PreferenceStore.h"

namespace platform::prefs {

class FakePreferenceStore final : public PreferenceStore {
 public:
  // Sets one key; a none value removes it.
  void setValue(std::string_view domain, std::string_view key, Value value);
  // Replaces a whole domain, as if its file had been rewritten.
  void setDomain(std::string_view domain, Dictionary preferences);
  void removeDomain(std::string_view domain);

  Value valueForKey(std::string_view domain, std::string_view key) const override;

 private:
  mutable std::mutex mu_;
  std::map<std::string, Dictionary, std::less<>> domains_;
};

}  // namespace platform::prefs
