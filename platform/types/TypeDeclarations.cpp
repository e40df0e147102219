#include "platform/types/TypeDeclarations.h"

#include <utility>

namespace platform::types {
namespace {

Error malformed(std::size_t index, std::string_view what) {
  return typesError(TypesErrorCode::Malformed,
                    "declaration " + std::to_string(index) + ": " + std::string(what));
}

}  // namespace

Error typesError(TypesErrorCode code, std::string message) {
  return Error(std::string(kTypesErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isTypesError(const Error& error, TypesErrorCode code) {
  return error.is(kTypesErrorDomain, static_cast<std::int64_t>(code));
}

bool isValidTypeIdentifier(std::string_view identifier, std::size_t maxBytes) {
  return !identifier.empty() && identifier.size() <= maxBytes &&
         identifier.find('\0') == std::string_view::npos;
}

Result<std::vector<TypeDeclaration>> parseTypeDeclarations(const Value& document,
                                                           const DeclarationLimits& limits) {
  const Array* list = document.array();
  if (list == nullptr) {
    return typesError(TypesErrorCode::Malformed,
                      std::string("holds a ") + valueTypeName(document.type()) +
                          ", not a list of type declarations");
  }
  if (list->size() > limits.maxDeclarations) {
    return typesError(TypesErrorCode::TooMany,
                      std::to_string(list->size()) + " declarations, more than " +
                          std::to_string(limits.maxDeclarations));
  }
  std::vector<TypeDeclaration> declarations;
  declarations.reserve(list->size());
  for (std::size_t index = 0; index < list->size(); ++index) {
    const Dictionary* entry = (*list)[index].dictionary();
    if (entry == nullptr) return malformed(index, "not a dictionary");
    const std::string* identifier = entry->get(kTypeIdentifierKey).string();
    if (identifier == nullptr) return malformed(index, "no identifier string");
    if (!isValidTypeIdentifier(*identifier, limits.maxIdentifierBytes)) {
      return malformed(index, "invalid identifier");
    }
    TypeDeclaration declaration{*identifier, {}};
    const Value& ancestors = entry->get(kTypeConformsToKey);
    if (!ancestors.isNone()) {
      const Array* names = ancestors.array();
      if (names == nullptr) return malformed(index, "conformsTo is not a list");
      if (names->size() > limits.maxConformsTo) {
        return typesError(TypesErrorCode::TooMany,
                          "declaration " + std::to_string(index) + ": " +
                              std::to_string(names->size()) + " conformances, more than " +
                              std::to_string(limits.maxConformsTo));
      }
      for (const Value& name : *names) {
        const std::string* ancestor = name.string();
        if (ancestor == nullptr || !isValidTypeIdentifier(*ancestor, limits.maxIdentifierBytes)) {
          return malformed(index, "conformsTo holds an invalid identifier");
        }
        declaration.conformsTo.push_back(*ancestor);
      }
    }
    declarations.push_back(std::move(declaration));
  }
  return declarations;
}

}  // namespace platform::types
