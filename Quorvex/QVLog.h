// The category logs of the "com.corvane.Quorvex" subsystem and the
// internal-diagnostics flag.
//
// Thread safety: every accessor may be called from any thread; each log is
// created once per process, even when first asked for concurrently, and is
// read-only afterwards.
#pragma once

#include <functional>
#include <string_view>

#include "platform/log/Logger.h"
#include "platform/values/Result.h"

inline constexpr std::string_view QVLogSubsystem = "com.corvane.Quorvex";

// Lifecycle, clients, requests, holds, termination, database: everything not
// covered by a more specific category.
const platform::log::Logger& QVLogOps();
// Request detail: UUID and path resolution, client-library request dumps.
const platform::log::Logger& QVLogTraffic();
// Match-rule evaluation.
const platform::log::Logger& QVLogExtension();
// Work with the registration service and plug-in records.
const platform::log::Logger& QVLogHV();
// Sandbox extensions issued and consumed.
const platform::log::Logger& QVLogSandbox();

// Whether this system is an internal-diagnostics variant for the subsystem;
// asked once per process. Some failures are logged at fault level when true
// and at error level when false.
bool QVInternalDiagnostics();

// The level for such failures: Fault on internal-diagnostics systems, else Error.
platform::log::Level QVDiagnosticFailureLevel();

namespace qv_internal {

using LogCreator = std::function<platform::Result<const platform::log::Logger*>(
    std::string_view subsystem, std::string_view category)>;

// The log for `category` made by `create`; when that fails, the process's
// default log, after writing "unable to create tracelog for category %s" to
// it (error).
const platform::log::Logger& makeCategoryLog(std::string_view category, const LogCreator& create);

}  // namespace qv_internal
