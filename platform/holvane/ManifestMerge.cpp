#include "platform/holvane/ManifestMerge.h"

#include <unordered_set>

namespace platform::holvane {

bool sdkOverridesKey(std::string_view key) { return key == kCleanTimeoutKey; }

Dictionary mergeDictionaryInto(const Dictionary& source, const Dictionary& target) {
  Dictionary result = target;
  for (const auto& [key, s] : source) {
    const Value t = result.get(key);
    if (t.isNone() || sdkOverridesKey(key)) {
      result.set(key, s);
    } else if (key == kSharedResourcesKey) {
      // Only two lists merge; a plug-in that states its resources in
      // another shape keeps what it said.
      if (s.array() && t.array()) {
        result.set(key, mergeSharedResourcesInto(*s.array(), *t.array()));
      }
    } else if (s.dictionary() && t.dictionary()) {
      result.set(key, mergeDictionaryInto(*s.dictionary(), *t.dictionary()));
    }
    // Otherwise the plug-in's own value stays, whatever its kind.
  }
  return result;
}

Array mergeSharedResourcesInto(const Array& source, const Array& target) {
  std::unordered_set<Value, ValueHash> seen;
  Array result;
  result.reserve(target.size() + source.size());
  for (const Array* list : {&target, &source}) {
    for (const Value& entry : *list) {
      if (seen.insert(entry).second) result.append(entry);
    }
  }
  return result;
}

}  // namespace platform::holvane
