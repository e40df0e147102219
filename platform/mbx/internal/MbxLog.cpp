#include "platform/mbx/internal/MbxLog.h"

#include "platform/log/LoggerRegistry.h"

namespace platform::mbx::internal {

const log::Logger& mbxLog() {
  // The names are fixed and valid, so the registry cannot refuse them; should
  // it run out of loggers, the default log still takes the lines.
  static const log::Logger& logger = [] () -> const log::Logger& {
    auto made = log::LoggerRegistry::shared().logger("com.corvane.platform", "mbx");
    return made.ok() ? *made.value() : log::defaultLog();
  }();
  return logger;
}

}  // namespace platform::mbx::internal
