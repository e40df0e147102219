#include "platform/sandbox/internal/SandboxLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::sandbox::internal {

const log::Logger& sandboxLog() {
  static const log::Logger& logger = []() -> const log::Logger& {
    auto made = log::LoggerRegistry::shared().logger("com.corvane.platform", "sandbox");
    return made.ok() ? **made : log::defaultLog();
  }();
  return logger;
}

}  // namespace platform::sandbox::internal
