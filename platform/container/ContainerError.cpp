#include "platform/container/ContainerError.h"

namespace platform::container {

Error containerError(ContainerErrorCode code, std::string message) {
  return Error(std::string(kContainerErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isContainerError(const Error& error, ContainerErrorCode code) {
  return error.is(kContainerErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::container
