// The logger of the message system ("com.corvane.platform", "mbx").
//
// Thread safety: safe from any thread; the logger lives until the process ends.
#pragma once

#include "platform/log/Logger.h"

namespace platform::mbx::internal {

const log::Logger& mbxLog();

}  // namespace platform::mbx::internal
