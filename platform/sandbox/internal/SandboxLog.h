// The log of the sandbox layer: category "sandbox" of "com.corvane.platform".
//
// Thread safety: made once, read-only afterwards; safe from any thread.
#pragma once

#include "platform/log/Logger.h"

namespace platform::sandbox::internal {

const log::Logger& sandboxLog();

}  // namespace platform::sandbox::internal
