#include "platform/codesign/CodesignError.h"

namespace platform::codesign {

const char* codesignErrorCodeName(CodesignErrorCode code) {
  switch (code) {
    case CodesignErrorCode::InvalidPath:
      return "invalid path";
    case CodesignErrorCode::TooManyGrantFiles:
      return "too many grant files";
    case CodesignErrorCode::NotADirectory:
      return "not a directory";
    case CodesignErrorCode::Untrusted:
      return "untrusted";
    case CodesignErrorCode::NotARegularFile:
      return "not a regular file";
    case CodesignErrorCode::TooLarge:
      return "too large";
    case CodesignErrorCode::Malformed:
      return "malformed";
  }
  return "unknown";
}

Error codesignError(CodesignErrorCode code, std::string message) {
  return Error(std::string(kCodesignErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isCodesignError(const Error& error, CodesignErrorCode code) {
  return error.is(kCodesignErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::codesign
