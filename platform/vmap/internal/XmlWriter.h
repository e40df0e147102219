// Writing the XML form.
//
// Thread safety: pure function.
#pragma once

#include <string>

#include "platform/values/Result.h"
#include "platform/values/Value.h"
#include "platform/vmap/Writer.h"

namespace platform::vmap::internal {

Result<std::string> writeXml(const Value& value, const WriteLimits& limits);

}  // namespace platform::vmap::internal
