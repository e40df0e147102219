#include "platform/holvane/internal/HolvaneLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::holvane::internal {

const log::Logger& holvaneLog() {
  static const log::Logger& logger = log::platformLog("holvane");
  return logger;
}

}  // namespace platform::holvane::internal
