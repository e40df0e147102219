#include "platform/log/LoggerRegistry.h"

#include <cstdlib>

#include "platform/log/internal/NameRules.h"
#include "platform/log/internal/Output.h"

namespace platform::log {
namespace {

std::string_view filterFromEnvironment() {
  const char* text = std::getenv("QV_LOG");
  return text != nullptr ? std::string_view(text) : std::string_view();
}

}  // namespace

LoggerRegistry& LoggerRegistry::shared() {
  static LoggerRegistry* registry = new LoggerRegistry();
  return *registry;
}

LoggerRegistry::LoggerRegistry()
    : defaultLog_(new Logger(std::string(), std::string(), kDefaultThreshold)) {
  std::lock_guard<std::mutex> lock(mu_);
  applyFilterLocked(filterFromEnvironment());
}

Result<const Logger*> LoggerRegistry::logger(std::string_view subsystem,
                                             std::string_view category) {
  std::optional<LoggerError> bad = internal::checkName(subsystem);
  if (!bad) bad = internal::checkName(category);
  if (bad) return makeLoggerError(*bad, subsystem, category);
  std::lock_guard<std::mutex> lock(mu_);
  auto key = std::make_pair(subsystem, category);
  if (auto it = loggers_.find(key); it != loggers_.end()) {
    return it->second.get();
  }
  if (loggers_.size() >= kMaxLoggers) {
    return makeLoggerError(LoggerError::TooManyLoggers, subsystem, category);
  }
  std::unique_ptr<Logger> made(new Logger(std::string(subsystem), std::string(category),
                                          filter_.thresholdFor(subsystem, category)));
  const Logger* result = made.get();
  loggers_.emplace(std::make_pair(std::string(subsystem), std::string(category)), std::move(made));
  return result;
}

void LoggerRegistry::applyFilterLocked(std::string_view filterText) {
  Filter::Parsed parsed = Filter::parse(filterText);
  // Reported around the filter, not through it: a filter of "off" must not
  // hide its own mistakes.
  for (const std::string& problem : parsed.problems) {
    internal::Output::shared().write(Level::Error, {}, {}, "QV_LOG: " + problem);
  }
  filter_ = std::move(parsed.filter);
  defaultLog_->setThreshold(filter_.globalThreshold());
  for (auto& [names, logger] : loggers_) {
    logger->setThreshold(filter_.thresholdFor(names.first, names.second));
  }
}

void LoggerRegistry::applyFilterForTesting(std::string_view filterText) {
  std::lock_guard<std::mutex> lock(mu_);
  applyFilterLocked(filterText);
}

void LoggerRegistry::reloadEnvironmentForTesting() {
  internal::Output::shared().reloadEnvironmentForTesting();
  std::lock_guard<std::mutex> lock(mu_);
  applyFilterLocked(filterFromEnvironment());
}

const Logger& defaultLog() {
  return LoggerRegistry::shared().defaultLog();
}

const Logger& platformLog(std::string_view category) {
  auto made = LoggerRegistry::shared().logger("com.corvane.platform", category);
  return made.ok() ? **made : defaultLog();
}

}  // namespace platform::log
