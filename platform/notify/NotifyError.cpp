#include "platform/notify/NotifyError.h"

namespace platform::notify {

const char* notifyErrorCodeName(NotifyErrorCode code) {
  switch (code) {
    case NotifyErrorCode::InvalidName:
      return "invalid name";
    case NotifyErrorCode::MalformedCounter:
      return "malformed counter";
    case NotifyErrorCode::NotARegularFile:
      return "not a regular file";
    case NotifyErrorCode::CounterOverflow:
      return "counter overflow";
  }
  return "unknown";
}

Error notifyError(NotifyErrorCode code, std::string message) {
  return Error(std::string(kNotifyErrorDomain), static_cast<std::int64_t>(code),
               std::move(message));
}

bool isNotifyError(const Error& error, NotifyErrorCode code) {
  return error.is(kNotifyErrorDomain, static_cast<std::int64_t>(code));
}

}  // namespace platform::notify
