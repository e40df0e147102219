#include "platform/codesign/internal/CodesignLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::codesign::internal {

const log::Logger& codesignLog() {
  static const log::Logger& logger = log::platformLog("codesign");
  return logger;
}

}  // namespace platform::codesign::internal
