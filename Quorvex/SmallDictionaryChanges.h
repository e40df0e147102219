// One-key change of a dictionary, for dictionaries others may hold (a
// plug-in's annotations): the change is made on a copy, never in place.
//
// Thread safety: pure. The copy costs time in proportion to the dictionary's
// size, so this is meant for small dictionaries such as one plug-in's
// annotations.
#pragma once

#include <string_view>

#include "platform/values/Value.h"

// A copy of `receiver` in which `key` holds `value`, or in which `key` is
// absent when `value` is none. The receiver is never modified.
inline platform::Dictionary dictionaryChangingTo(const platform::Dictionary& receiver,
                                                 std::string_view key, platform::Value value) {
  platform::Dictionary copy = receiver;
  copy.set(key, std::move(value));
  return copy;
}
