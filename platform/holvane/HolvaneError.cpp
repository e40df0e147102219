#include "platform/holvane/HolvaneError.h"

namespace platform::holvane {

const char* holvaneErrorCodeName(HolvaneErrorCode code) {
  switch (code) {
    case HolvaneErrorCode::InvalidIdentifier:
      return "invalid identifier";
    case HolvaneErrorCode::Malformed:
      return "malformed";
  }
  return "unknown";
}

Error holvaneError(HolvaneErrorCode code, std::string message) {
  return Error(std::string(kHolvaneErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isHolvaneError(const Error& error, HolvaneErrorCode code) {
  return error.is(kHolvaneErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::holvane
