#include "platform/vmap/VmapError.h"

namespace platform::vmap {

const char* errorCodeName(ErrorCode code) {
  switch (code) {
    case ErrorCode::NotAVmapDocument: return "not a vmap document";
    case ErrorCode::MalformedXml: return "malformed XML";
    case ErrorCode::ForbiddenDeclaration: return "forbidden declaration";
    case ErrorCode::BadRoot: return "bad root";
    case ErrorCode::UnknownElement: return "unknown element";
    case ErrorCode::MisplacedElement: return "misplaced element";
    case ErrorCode::UnexpectedText: return "unexpected text";
    case ErrorCode::UnexpectedAttribute: return "unexpected attribute";
    case ErrorCode::MissingValue: return "missing value";
    case ErrorCode::DuplicateKey: return "duplicate key";
    case ErrorCode::ExtraValue: return "extra value";
    case ErrorCode::BadInteger: return "bad integer";
    case ErrorCode::BadReal: return "bad real";
    case ErrorCode::BadDate: return "bad date";
    case ErrorCode::BadData: return "bad data";
    case ErrorCode::BadUuid: return "bad UUID";
    case ErrorCode::BadBinary: return "bad binary form";
    case ErrorCode::TooDeep: return "too deep";
    case ErrorCode::TooLarge: return "too large";
    case ErrorCode::TooManyItems: return "too many items";
    case ErrorCode::NotARegularFile: return "not a regular file";
    case ErrorCode::NotRepresentable: return "not representable";
    case ErrorCode::InvalidArgument: return "invalid argument";
  }
  return "unknown";
}

}  // namespace platform::vmap
