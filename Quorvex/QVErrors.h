// The program's own errors: the "Quorvex" domain and its codes. The numbers
// travel on the wire, so they never change.
//
// Thread safety: errors are immutable values; the makers are pure.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/log/Format.h"
#include "platform/values/Error.h"

inline constexpr std::string_view QVQuorvexErrorDomain = "Quorvex";

enum QVErrorCode : std::int64_t {
  QVErrorRegistryFailure = 2,  // the registration service did not (de)register a plug-in
  QVErrorInvalidRequest = 4,   // malformed request, unknown plug-in, failed operation
  QVErrorVersionMismatch = 7,  // protocol or annotation-database version unsupported
  QVErrorBadPath = 9,          // a path is not absolute, unresolvable, or names no plug-in
  QVErrorDenied = 11,          // the caller is not allowed to do this
  QVErrorInvalidPlugIn = 12,   // a plug-in's definition is unusable
  QVErrorBusy = 14,            // a hold was refused because plug-ins are busy
  QVErrorNotFound = 15,        // a find request's plug-in cannot be located
  QVErrorInvalidValue = 18,    // a bulk annotation value is not of the required kind
};

// "QVErrorBadPath" for 9; none for a number that is not one of the codes.
const char* QVErrorCodeName(std::int64_t code);

// An error of the Quorvex domain whose description is `message`; with no
// message the error has no user information at all.
platform::Error QVErrorWithCodeMessage(QVErrorCode code, std::optional<std::string> message);

// An error of the Quorvex domain whose description is `format` filled in
// printf-style (with "%@" for descriptions; nothing is redacted, since the
// text is meant for the client). A null format gives no user information.
template <typename... Args>
platform::Error QVErrorWithCodeFormat(QVErrorCode code, const char* format, const Args&... args) {
  if (format == nullptr) return QVErrorWithCodeMessage(code, std::nullopt);
  return QVErrorWithCodeMessage(
      code, platform::log::formatMessage(platform::log::Redaction::Off, format, args...));
}

// Whether `error` is of the Quorvex domain with `code`.
inline bool QVErrorIs(const platform::Error& error, QVErrorCode code) {
  return error.is(QVQuorvexErrorDomain, code);
}
