// Errors of the registration database, in the holvane error domain. They are
// numbered from 100 so that they never meet the codes of HolvaneError.h.
//
// Thread safety: constants and pure functions only.
#pragma once

#include <cstdint>
#include <string>

#include "platform/holvane/HolvaneError.h"

namespace platform::holvane {

// Callers and tests match on these: never renumber.
enum class RegistryErrorCode : std::int64_t {
  Refused = 100,   // a bundle that cannot be registered (reason in the message)
  NotFound = 101,  // no record at that path or UUID
  Storage = 102,   // the database failed to read or write
  Corrupt = 103,   // the database file is damaged or not a database
  TooMany = 104,   // a directory holds more bundles than a scan accepts
};

const char* registryErrorCodeName(RegistryErrorCode code);

Error registryError(RegistryErrorCode code, std::string message);

bool isRegistryError(const Error& error, RegistryErrorCode code);

}  // namespace platform::holvane
