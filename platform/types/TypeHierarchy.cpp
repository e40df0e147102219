#include "platform/types/TypeHierarchy.h"

#include <set>
#include <utility>

namespace platform::types {

bool TypeHierarchy::declare(TypeDeclaration declaration) {
  if (parents_.find(declaration.identifier) != parents_.end()) return false;
  parents_.emplace(std::move(declaration.identifier), std::move(declaration.conformsTo));
  return true;
}

bool TypeHierarchy::isDeclared(std::string_view identifier) const {
  return parents_.find(identifier) != parents_.end();
}

bool TypeHierarchy::conformsTo(std::string_view type, std::string_view other) const {
  if (type.empty() || other.empty()) return false;
  if (type == other) return true;
  // Every ancestor once, in no particular order. The views point into
  // parents_ (or at `type`), which do not change during a const walk.
  std::set<std::string_view> seen{type};
  std::vector<std::string_view> pending{type};
  while (!pending.empty()) {
    const std::string_view current = pending.back();
    pending.pop_back();
    const auto found = parents_.find(current);
    if (found == parents_.end()) continue;
    for (const std::string& parent : found->second) {
      if (parent == other) return true;
      if (seen.insert(parent).second) pending.push_back(parent);
    }
  }
  return false;
}

}  // namespace platform::types
