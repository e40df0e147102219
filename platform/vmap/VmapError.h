// Errors of the vmap reader and writer: one domain, a code per kind of
// fault, and the position of the fault in the user information so that tools
// can point at it without parsing the message.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string_view>

namespace platform::vmap {

inline constexpr std::string_view kErrorDomain = "vmap";

// User-information keys. Line and Column (1-based) locate a fault in the XML
// form, Offset (0-based, from the start of the file) one in the binary form;
// Path is present when the document came from a file.
inline constexpr std::string_view kErrorLineKey = "Line";
inline constexpr std::string_view kErrorColumnKey = "Column";
inline constexpr std::string_view kErrorOffsetKey = "Offset";
inline constexpr std::string_view kErrorPathKey = "Path";

// Callers and tools match on these: never renumber.
enum class ErrorCode : std::int64_t {
  NotAVmapDocument = 1,       // neither form: the first bytes are wrong
  MalformedXml = 2,           // not well-formed XML, as expat sees it
  ForbiddenDeclaration = 3,   // a DOCTYPE, entity declaration or foreign encoding
  BadRoot = 4,                // missing or other root element, or wrong version
  UnknownElement = 5,
  MisplacedElement = 6,       // a known element where it cannot stand (<key> in <array>)
  UnexpectedText = 7,         // non-white-space text where no text belongs
  UnexpectedAttribute = 8,
  MissingValue = 9,           // a key without a value, or an empty root
  DuplicateKey = 10,
  ExtraValue = 11,            // a second value in the root
  BadInteger = 12,
  BadReal = 13,
  BadDate = 14,
  BadData = 15,               // bad base64
  BadUuid = 16,
  BadBinary = 17,             // the CBOR item is malformed or carries a kind vmap lacks
  TooDeep = 18,
  TooLarge = 19,              // more bytes than the limit
  TooManyItems = 20,          // more values than the limit
  NotARegularFile = 21,
  NotRepresentable = 22,      // writing: a value the chosen form cannot carry
  InvalidArgument = 23,       // e.g. a relative path
};

// "unknown element", "duplicate key", ... : a short name for logs and tests.
const char* errorCodeName(ErrorCode code);

}  // namespace platform::vmap
