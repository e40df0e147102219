// A leveled logger for one (subsystem, category). Loggers come from
// LoggerRegistry, live until the process ends, and are handed out as stable
// `const Logger&` references that callers may keep in a static.
//
//   logger.info("loaded %{public}@ in %.3f s", bundleId, seconds);
//   logger.error("open %{public}s: %{errno}d", path, errno);
//
// Formats follow Format.h. A disabled level costs one relaxed atomic load: no
// argument is captured, formatted or described, and nothing is allocated.
#pragma once

#include <array>
#include <atomic>
#include <cstddef>
#include <cstdint>
#include <span>
#include <string>
#include <string_view>

#include "platform/log/Format.h"
#include "platform/log/FormatString.h"
#include "platform/log/Level.h"
#include "platform/log/internal/Argument.h"

namespace platform::log {

// Thread safety: safe from any thread; the threshold may change (tests) while others log.
class Logger {
 public:
  Logger(const Logger&) = delete;
  Logger& operator=(const Logger&) = delete;

  // Both empty for the default log.
  const std::string& subsystem() const { return subsystem_; }
  const std::string& category() const { return category_; }

  bool isEnabled(Level level) const {
    return static_cast<std::uint8_t>(level) >= threshold_.load(std::memory_order_relaxed);
  }

  template <typename... Args>
  void log(Level level, FormatString format, const Args&... args) const noexcept {
    if (!isEnabled(level)) return;
    const std::array<internal::Argument, sizeof...(Args)> captured{internal::capture(args)...};
    emit(level, format.view(), captured);
  }

  template <typename... Args>
  void debug(FormatString format, const Args&... args) const noexcept {
    log(Level::Debug, format, args...);
  }
  template <typename... Args>
  void info(FormatString format, const Args&... args) const noexcept {
    log(Level::Info, format, args...);
  }
  // The Default level.
  template <typename... Args>
  void notice(FormatString format, const Args&... args) const noexcept {
    log(Level::Default, format, args...);
  }
  template <typename... Args>
  void error(FormatString format, const Args&... args) const noexcept {
    log(Level::Error, format, args...);
  }
  template <typename... Args>
  void fault(FormatString format, const Args&... args) const noexcept {
    log(Level::Fault, format, args...);
  }

 private:
  friend class LoggerRegistry;

  Logger(std::string subsystem, std::string category, Threshold threshold);
  void setThreshold(Threshold threshold) const {
    threshold_.store(static_cast<std::uint8_t>(threshold), std::memory_order_relaxed);
  }
  // Formats (redacting unless QV_LOG_PRIVATE=1) and writes one line. A line
  // that cannot be built (out of memory) is dropped: logging never throws.
  void emit(Level level, std::string_view format,
            std::span<const internal::Argument> arguments) const noexcept;

  const std::string subsystem_;
  const std::string category_;
  mutable std::atomic<std::uint8_t> threshold_;
};

}  // namespace platform::log
