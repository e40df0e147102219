// The log of the service manager: category "lumend" of the
// "com.corvane.platform" subsystem.
//
// Thread safety: safe from any thread; the logger is made once.
#pragma once

#include "platform/log/Logger.h"

namespace platform::lumend::internal {

const log::Logger& lumendLog();

}  // namespace platform::lumend::internal
