#include "platform/mbx/internal/MbxLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::mbx::internal {

const log::Logger& mbxLog() {
  static const log::Logger& logger = log::platformLog("mbx");
  return logger;
}

}  // namespace platform::mbx::internal
