// The log of the entitlement layer: category "codesign" of the
// "com.corvane.platform" subsystem.
//
// Thread safety: safe from any thread; the logger is made once.
#pragma once

#include "platform/log/Logger.h"

namespace platform::codesign::internal {

const log::Logger& codesignLog();

}  // namespace platform::codesign::internal
