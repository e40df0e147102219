#include "platform/log/SignpostInterval.h"

#include <string>

namespace platform::log {

SignpostInterval::SignpostInterval(const Logger& logger, std::string_view name)
    : logger_(logger), name_(name), enabled_(logger.isEnabled(Level::Debug)) {
  if (!enabled_) return;
  logger_.debug("signpost begin %{public}s", std::string(name_));
  begin_ = std::chrono::steady_clock::now();
}

SignpostInterval::~SignpostInterval() {
  if (!enabled_) return;
  const double micros =
      std::chrono::duration<double, std::micro>(std::chrono::steady_clock::now() - begin_).count();
  logger_.debug("signpost end %{public}s after %.1f us", std::string(name_), micros);
}

}  // namespace platform::log
