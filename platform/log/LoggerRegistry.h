// Makes and keeps the process's loggers: one per (subsystem, category),
// created on first request and kept until the process ends. Reads the QV_LOG
// filter once, when first used, and reports its malformed entries on stderr.
//
//   static const Logger& ops =
//       *LoggerRegistry::shared().logger("com.corvane.Quorvex", "ops").value();
#pragma once

#include <cstddef>
#include <map>
#include <memory>
#include <mutex>
#include <string>
#include <string_view>
#include <utility>

#include "platform/log/Filter.h"
#include "platform/log/Logger.h"
#include "platform/log/LoggerError.h"
#include "platform/values/Result.h"

namespace platform::log {

// Thread safety: safe from any thread; concurrent first requests for a pair get one logger.
class LoggerRegistry {
 public:
  // Loggers are never freed, so their number is bounded.
  static constexpr std::size_t kMaxLoggers = 1024;

  // Never destroyed, so loggers stay valid during exit.
  static LoggerRegistry& shared();

  // The logger for (subsystem, category), never null on success. Names are
  // 1 to 128 bytes of visible ASCII other than ',' ':' '='; errors are of
  // kLoggerErrorDomain with a LoggerError code.
  Result<const Logger*> logger(std::string_view subsystem, std::string_view category);

  // The process default log, for messages tied to no category (empty
  // subsystem and category; only the global QV_LOG threshold applies).
  const Logger& defaultLog() const { return *defaultLog_; }

  // Applies `filterText` as if QV_LOG held it (malformed entries are
  // reported as at start) to every logger, present and future.
  void applyFilterForTesting(std::string_view filterText);
  // Reads QV_LOG, QV_LOG_PRIVATE and JOURNAL_STREAM again.
  void reloadEnvironmentForTesting();

 private:
  LoggerRegistry();
  // REQUIRES: mu_ held.
  void applyFilterLocked(std::string_view filterText);

  // Orders (subsystem, category) pairs of strings or string_views alike, so
  // that a lookup builds no strings.
  struct NamesLess {
    using is_transparent = void;
    template <typename A, typename B>
    bool operator()(const A& a, const B& b) const {
      std::string_view as(a.first), bs(b.first);
      if (as != bs) return as < bs;
      return std::string_view(a.second) < std::string_view(b.second);
    }
  };

  std::mutex mu_;
  Filter filter_;  // guarded by mu_
  // Guarded by mu_; the Loggers themselves are shared read-only.
  std::map<std::pair<std::string, std::string>, std::unique_ptr<Logger>, NamesLess> loggers_;
  std::unique_ptr<Logger> defaultLog_;
};

// LoggerRegistry::shared().defaultLog().
const Logger& defaultLog();

// The log of a category of the platform's own subsystem
// ("com.corvane.platform"); the default log when the registry refuses it
// (it is full: the default log then still carries the lines). Callers keep
// the reference in a function-local static.
const Logger& platformLog(std::string_view category);

}  // namespace platform::log
