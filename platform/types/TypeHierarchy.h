// The conformance graph of declared types: each identifier with its direct
// ancestors. Declarations may name ancestors that are never declared (they
// are leaves) and may form cycles; the walk visits each type once, so a
// cycle ends it rather than looping.
//
// Thread safety: a plain value type; const members may be called from any
// thread while nothing modifies it.
#pragma once

#include <cstddef>
#include <map>
#include <string>
#include <string_view>
#include <vector>

namespace platform::types {

struct TypeDeclaration {
  std::string identifier;
  // Direct ancestors, in declaration order.
  std::vector<std::string> conformsTo;
  bool operator==(const TypeDeclaration&) const = default;
};

class TypeHierarchy {
 public:
  // Adds a declaration. A second declaration of an identifier is refused
  // (false, nothing changes): the first one stands.
  bool declare(TypeDeclaration declaration);
  bool isDeclared(std::string_view identifier) const;
  // The number of declared identifiers.
  std::size_t size() const { return parents_.size(); }

  // `type` equals `other`, or `other` is reachable from `type` through
  // declared conformances. Empty identifiers conform to nothing. The walk
  // costs at most one visit per distinct type reachable from `type`.
  bool conformsTo(std::string_view type, std::string_view other) const;

 private:
  std::map<std::string, std::vector<std::string>, std::less<>> parents_;
};

}  // namespace platform::types
