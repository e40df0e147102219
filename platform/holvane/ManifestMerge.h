// How an extension point's SDK dictionary and a plug-in's own info
// dictionary combine. The registration service and the plug-in record both
// merge manifests, and they must agree, so the rules live here once.
//
// Thread safety: pure functions; call them from any thread.
#pragma once

#include <string_view>

#include "platform/values/Value.h"

namespace platform::holvane {

// The list of resources a plug-in shares with its host: merged as a set.
inline constexpr std::string_view kSharedResourcesKey = "Shared";
// The one key where the SDK's value wins over the plug-in's.
inline constexpr std::string_view kCleanTimeoutKey = "CleanTimeout";

// `target` with `source` merged in, level by level; neither is modified. A
// key only `source` has is added; nested dictionaries merge; the two
// "Shared" lists merge as sets; for every other key `target` keeps its
// value, except that `source` wins for "CleanTimeout".
Dictionary mergeDictionaryInto(const Dictionary& source, const Dictionary& target);

// True exactly for "CleanTimeout".
bool sdkOverridesKey(std::string_view key);

// The union of both lists without duplicates: target's entries first, then
// source's new ones.
Array mergeSharedResourcesInto(const Array& source, const Array& target);

}  // namespace platform::holvane
