#include "platform/bundle/BundleError.h"

namespace platform::bundle {

Error bundleError(BundleErrorCode code, std::string message) {
  return Error(std::string(kBundleErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isBundleError(const Error& error, BundleErrorCode code) {
  return error.is(kBundleErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::bundle
