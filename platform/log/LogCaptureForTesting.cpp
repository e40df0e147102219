#include "platform/log/LogCaptureForTesting.h"

#include "platform/log/internal/Output.h"

namespace platform::log {

LogCaptureForTesting::LogCaptureForTesting(CaptureEcho echo) : echo_(echo) {
  internal::Output::shared().addCapture(this);
}

LogCaptureForTesting::~LogCaptureForTesting() {
  internal::Output::shared().removeCapture(this);
}

std::vector<CapturedLine> LogCaptureForTesting::lines() const {
  std::lock_guard<std::mutex> lock(mu_);
  return lines_;
}

std::vector<std::string> LogCaptureForTesting::messages() const {
  std::lock_guard<std::mutex> lock(mu_);
  std::vector<std::string> out;
  out.reserve(lines_.size());
  for (const CapturedLine& line : lines_) out.push_back(line.message);
  return out;
}

std::size_t LogCaptureForTesting::size() const {
  std::lock_guard<std::mutex> lock(mu_);
  return lines_.size();
}

void LogCaptureForTesting::clear() {
  std::lock_guard<std::mutex> lock(mu_);
  lines_.clear();
}

void LogCaptureForTesting::record(Level level, std::string_view subsystem,
                                  std::string_view category, std::string_view message) {
  CapturedLine line{level, std::string(subsystem), std::string(category), std::string(message)};
  std::lock_guard<std::mutex> lock(mu_);
  lines_.push_back(std::move(line));
}

}  // namespace platform::log
