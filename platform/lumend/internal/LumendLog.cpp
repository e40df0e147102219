#include "platform/lumend/internal/LumendLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::lumend::internal {

const log::Logger& lumendLog() {
  static const log::Logger& logger = log::platformLog("lumend");
  return logger;
}

}  // namespace platform::lumend::internal
