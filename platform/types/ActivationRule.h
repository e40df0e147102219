// Activation rules: what a plug-in says it can work on, checked against
// what a host offers.
//
// A rule in dictionary form maps an item kind to the most items of that
// kind the plug-in accepts: a number (a maximum count) or true (any
// count). The host's items map item kind to count. The rule accepts the
// items when every kind offered (count above 0) is in the rule and its
// count is within the rule's maximum. So a rule {"image": 5, "url": true}
// accepts {"image": 2} and {"url": 40, "image": 5}, but not {"image": 6}
// nor {"movie": 1}; offering nothing is always accepted.
//
// A kind the rule maps to false, or to a negative or non-number maximum,
// is not allowed at all. A count that is not a non-negative integer
// (a real, a boolean, a text) is malformed and the items are refused.
// Rules in text form (a predicate) are not supported: they accept nothing,
// as does any rule that is not a dictionary.
//
// Thread safety: pure function.
#pragma once

#include "platform/values/Value.h"

namespace platform::types {

bool evaluateActivationRule(const Value& rule, const Dictionary& items);

}  // namespace platform::types
