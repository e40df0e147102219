// Reading one type-declarations document: an array of dictionaries
//   { identifier: "com.example.child", conformsTo: ["com.example.parent"] }
// "conformsTo" may be absent (a type with no ancestors); other keys are
// ignored, so declarations may carry descriptions. A document is taken
// whole or not at all: one malformed declaration makes the whole document
// untrustworthy, since a half-read hierarchy would answer conformance
// questions wrongly without anyone noticing.
//
// Thread safety: pure functions.
#pragma once

#include <cstddef>
#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include "platform/types/TypeHierarchy.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace platform::types {

inline constexpr std::string_view kTypesErrorDomain = "com.corvane.platform.types";

// Callers and tests match on these: never renumber.
enum class TypesErrorCode : std::int64_t {
  Malformed = 1,  // the document or a declaration has the wrong shape
  TooMany = 2,    // more declarations or conformances than the limits allow
};

Error typesError(TypesErrorCode code, std::string message);
bool isTypesError(const Error& error, TypesErrorCode code);

inline constexpr std::string_view kTypeIdentifierKey = "identifier";
inline constexpr std::string_view kTypeConformsToKey = "conformsTo";

struct DeclarationLimits {
  std::size_t maxDeclarations = 10'000;     // per document
  std::size_t maxConformsTo = 64;           // per declaration
  std::size_t maxIdentifierBytes = 255;     // an identifier or an ancestor's
};

// Whether `identifier` can name a type: 1 to `maxBytes` bytes, no NUL.
bool isValidTypeIdentifier(std::string_view identifier, std::size_t maxBytes);

// The declarations of `document`, in its order, or the first problem
// (TypesErrorCode, with the index of the offending declaration).
Result<std::vector<TypeDeclaration>> parseTypeDeclarations(const Value& document,
                                                           const DeclarationLimits& limits = {});

}  // namespace platform::types
