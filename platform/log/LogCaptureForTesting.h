// Records the lines logged while it exists, so that a test can check what
// was logged (the message as formatted, before escaping).
// Captures may nest; each sees every line.
#pragma once

#include <cstddef>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log/Level.h"

namespace platform::log {

namespace internal {
class Output;
}

struct CapturedLine {
  Level level = Level::Default;
  std::string subsystem;
  std::string category;
  std::string message;
};

enum class CaptureEcho {
  Silent,      // nothing reaches stderr while the capture exists
  AlsoStderr,  // lines are recorded and written as usual
};

// Thread safety: safe from any thread; lines may arrive from any thread while a test reads.
class LogCaptureForTesting {
 public:
  explicit LogCaptureForTesting(CaptureEcho echo = CaptureEcho::Silent);
  ~LogCaptureForTesting();
  LogCaptureForTesting(const LogCaptureForTesting&) = delete;
  LogCaptureForTesting& operator=(const LogCaptureForTesting&) = delete;

  CaptureEcho echo() const { return echo_; }

  // A copy of the lines recorded so far, in the order they were written.
  std::vector<CapturedLine> lines() const;
  // The messages alone, in order.
  std::vector<std::string> messages() const;
  std::size_t size() const;
  void clear();

 private:
  friend class internal::Output;
  void record(Level level, std::string_view subsystem, std::string_view category,
              std::string_view message);

  const CaptureEcho echo_;
  mutable std::mutex mu_;
  std::vector<CapturedLine> lines_;
};

}  // namespace platform::log
