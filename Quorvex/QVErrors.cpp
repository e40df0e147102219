#include "Quorvex/QVErrors.h"

const char* QVErrorCodeName(std::int64_t code) {
  switch (code) {
    case QVErrorRegistryFailure: return "QVErrorRegistryFailure";
    case QVErrorInvalidRequest: return "QVErrorInvalidRequest";
    case QVErrorVersionMismatch: return "QVErrorVersionMismatch";
    case QVErrorBadPath: return "QVErrorBadPath";
    case QVErrorDenied: return "QVErrorDenied";
    case QVErrorInvalidPlugIn: return "QVErrorInvalidPlugIn";
    case QVErrorBusy: return "QVErrorBusy";
    case QVErrorNotFound: return "QVErrorNotFound";
    case QVErrorInvalidValue: return "QVErrorInvalidValue";
    default: return nullptr;
  }
}

platform::Error QVErrorWithCodeMessage(QVErrorCode code, std::optional<std::string> message) {
  if (!message) return platform::Error(std::string(QVQuorvexErrorDomain), code);
  return platform::Error(std::string(QVQuorvexErrorDomain), code, std::move(*message));
}
