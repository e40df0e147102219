#include "platform/holvane/RegistryError.h"

namespace platform::holvane {

const char* registryErrorCodeName(RegistryErrorCode code) {
  switch (code) {
    case RegistryErrorCode::Refused:
      return "refused";
    case RegistryErrorCode::NotFound:
      return "not found";
    case RegistryErrorCode::Storage:
      return "storage";
    case RegistryErrorCode::Corrupt:
      return "corrupt";
    case RegistryErrorCode::TooMany:
      return "too many";
  }
  return "unknown";
}

Error registryError(RegistryErrorCode code, std::string message) {
  return Error(std::string(kHolvaneErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isRegistryError(const Error& error, RegistryErrorCode code) {
  return error.is(kHolvaneErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::holvane
