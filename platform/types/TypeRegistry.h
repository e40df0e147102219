// The platform's types: which type identifiers conform to which, and the
// evaluation of a plug-in's activation rule against the items a host
// offers. Match rules ask both ("?KT-CONFORMS:", "?KT-IS:" and dictionary
// patterns). LinuxTypeRegistry answers from the type declarations of the
// system volume; testing/FakeTypeRegistry from what a test declared.
//
// Thread safety: implementations are safe to call from any thread.
#pragma once

#include <string_view>

#include "platform/values/Value.h"

namespace platform::types {

class TypeRegistry {
 public:
  virtual ~TypeRegistry() = default;

  // Whether `type` conforms to `other`: the two are equal, or `other` is
  // among the ancestors of `type` (its declared conformances, theirs, and so
  // on). An empty identifier conforms to nothing, not even to itself.
  virtual bool conformsTo(std::string_view type, std::string_view other) const = 0;

  // Whether the activation rule `rule` accepts the host's `items` (item kind
  // to count); see ActivationRule.h. Never fails: anything malformed is
  // not accepted.
  virtual bool evaluateActivationRule(const Value& rule, const Dictionary& items) const = 0;
};

}  // namespace platform::types
