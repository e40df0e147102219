#include "platform/sandbox/internal/SandboxLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::sandbox::internal {

const log::Logger& sandboxLog() {
  static const log::Logger& logger = log::platformLog("sandbox");
  return logger;
}

}  // namespace platform::sandbox::internal
