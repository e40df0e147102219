// The process's one log output: turns a formatted message into a line and
// writes it to stderr with a single write(2), so lines from different threads
// never interleave; hands it to any active LogCaptureForTesting.
#pragma once

#include <atomic>
#include <mutex>
#include <string>
#include <string_view>
#include <vector>

#include "platform/log/Format.h"
#include "platform/log/Level.h"
#include "platform/log/internal/LineFormat.h"

namespace platform::log {
class LogCaptureForTesting;
}

namespace platform::log::internal {

// True when `journalStream` (the value of JOURNAL_STREAM, "device:inode" in
// decimal) names the file open on `fd`.
bool isJournalStream(int fd, std::string_view journalStream);

// Thread safety: every member is safe from any thread.
class Output {
 public:
  // Made on first use from the environment (QV_LOG_PRIVATE, JOURNAL_STREAM);
  // never destroyed, so that logging during exit stays safe.
  static Output& shared();

  // Redaction::Off only when QV_LOG_PRIVATE is "1".
  Redaction redaction() const {
    return redact_.load(std::memory_order_relaxed) ? Redaction::On : Redaction::Off;
  }
  LineForm form() const {
    return journal_.load(std::memory_order_relaxed) ? LineForm::Journal : LineForm::Plain;
  }

  // Writes one line. The message is escaped here, whatever its origin.
  void write(Level level, std::string_view subsystem, std::string_view category,
             std::string_view message);

  // Reads QV_LOG_PRIVATE and JOURNAL_STREAM again.
  void reloadEnvironmentForTesting();
  // Sends lines to `fd` instead of stderr (the caller keeps ownership of
  // it) and re-checks JOURNAL_STREAM against it. Returns the previous one.
  int setDescriptorForTesting(int fd);

  void addCapture(LogCaptureForTesting* capture);
  void removeCapture(LogCaptureForTesting* capture);

 private:
  Output();
  void readEnvironment();
  // Returns false when an active capture asked for silence.
  bool recordInCaptures(Level level, std::string_view subsystem, std::string_view category,
                        std::string_view message);

  std::string processName_;
  std::atomic<int> fd_{2};
  std::atomic<bool> journal_{false};
  std::atomic<bool> redact_{true};

  std::atomic<int> captureCount_{0};  // lets write() skip the lock when zero
  std::mutex capturesMu_;
  std::vector<LogCaptureForTesting*> captures_;  // not owned
};

}  // namespace platform::log::internal
