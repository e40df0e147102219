// The log of the registration service: category "holvane" of the
// "com.corvane.platform" subsystem.
//
// Thread safety: safe from any thread; the logger is made once.
#pragma once

#include "platform/log/Logger.h"

namespace platform::holvane::internal {

const log::Logger& holvaneLog();

}  // namespace platform::holvane::internal
