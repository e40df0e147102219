#include "Quorvex/QVLog.h"

#include "platform/log/InternalDiagnostics.h"
#include "platform/log/LoggerRegistry.h"

namespace qv_internal {

const platform::log::Logger& makeCategoryLog(std::string_view category, const LogCreator& create) {
  auto made = create(QVLogSubsystem, category);
  if (made.ok()) return **made;
  const platform::log::Logger& fallback = platform::log::defaultLog();
  fallback.error("unable to create tracelog for category %s", category);
  return fallback;
}

}  // namespace qv_internal

namespace {

const platform::log::Logger& categoryLog(std::string_view category) {
  return qv_internal::makeCategoryLog(category, [](std::string_view s, std::string_view c) {
    return platform::log::LoggerRegistry::shared().logger(s, c);
  });
}

}  // namespace

// Function-local statics give the once-per-process guarantee: the first
// caller creates the log while concurrent callers wait for it.
const platform::log::Logger& QVLogOps() {
  static const platform::log::Logger& log = categoryLog("ops");
  return log;
}
const platform::log::Logger& QVLogTraffic() {
  static const platform::log::Logger& log = categoryLog("traffic");
  return log;
}
const platform::log::Logger& QVLogExtension() {
  static const platform::log::Logger& log = categoryLog("extension");
  return log;
}
const platform::log::Logger& QVLogHV() {
  static const platform::log::Logger& log = categoryLog("hv");
  return log;
}
const platform::log::Logger& QVLogSandbox() {
  static const platform::log::Logger& log = categoryLog("sandbox");
  return log;
}

bool QVInternalDiagnostics() {
  static const bool internal = platform::log::isInternalDiagnosticsVariant(QVLogSubsystem);
  return internal;
}

platform::log::Level QVDiagnosticFailureLevel() {
  return QVInternalDiagnostics() ? platform::log::Level::Fault : platform::log::Level::Error;
}
