#include "platform/holvane/internal/HolvaneLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::holvane::internal {

const log::Logger& holvaneLog() {
  // The names are valid constants, so the registry only fails when it is
  // full; the default log then still carries the reasons.
  static const log::Logger& logger = []() -> const log::Logger& {
    auto made = log::LoggerRegistry::shared().logger("com.corvane.platform", "holvane");
    return made.ok() ? **made : log::defaultLog();
  }();
  return logger;
}

}  // namespace platform::holvane::internal
