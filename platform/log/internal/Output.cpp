#include "platform/log/internal/Output.h"

#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cerrno>
#include <charconv>
#include <cstdlib>
#include <ctime>

#include "platform/log/LogCaptureForTesting.h"

namespace platform::log::internal {
namespace {

constexpr std::size_t kMaxProcessNameBytes = 64;

long currentThreadId() {
  thread_local const long id = static_cast<long>(::syscall(SYS_gettid));
  return id;
}

std::string processName() {
  std::string_view name = program_invocation_short_name;
  if (name.empty()) name = "?";
  std::string out;
  appendEscaped(out, name.substr(0, kMaxProcessNameBytes));
  return out;
}

// One write(2) for the whole line; only a short write (a line too long for
// the pipe to take at once) or EINTR makes us go on with the rest.
void writeAll(int fd, std::string_view text) {
  while (!text.empty()) {
    ssize_t n = ::write(fd, text.data(), text.size());
    if (n < 0) {
      if (errno == EINTR) continue;
      return;  // nowhere left to report a failure to log
    }
    text.remove_prefix(static_cast<std::size_t>(n));
  }
}

template <typename T>
bool parseDecimal(std::string_view text, T& value) {
  if (text.empty()) return false;
  auto [end, ec] = std::from_chars(text.data(), text.data() + text.size(), value);
  return ec == std::errc() && end == text.data() + text.size();
}

}  // namespace

bool isJournalStream(int fd, std::string_view journalStream) {
  if (journalStream.size() > 64) return false;
  std::size_t colon = journalStream.find(':');
  if (colon == std::string_view::npos) return false;
  unsigned long long device = 0;
  unsigned long long inode = 0;
  if (!parseDecimal(journalStream.substr(0, colon), device) ||
      !parseDecimal(journalStream.substr(colon + 1), inode)) {
    return false;
  }
  struct stat st {};
  if (::fstat(fd, &st) != 0) return false;
  return static_cast<unsigned long long>(st.st_dev) == device &&
         static_cast<unsigned long long>(st.st_ino) == inode;
}

Output& Output::shared() {
  static Output* output = new Output();
  return *output;
}

Output::Output() : processName_(processName()) {
  readEnvironment();
}

void Output::readEnvironment() {
  const char* privateData = std::getenv("QV_LOG_PRIVATE");
  redact_.store(privateData == nullptr || std::string_view(privateData) != "1");
  const char* stream = std::getenv("JOURNAL_STREAM");
  journal_.store(stream != nullptr && isJournalStream(fd_.load(), stream));
}

void Output::reloadEnvironmentForTesting() {
  readEnvironment();
}

int Output::setDescriptorForTesting(int fd) {
  int previous = fd_.exchange(fd);
  readEnvironment();
  return previous;
}

void Output::addCapture(LogCaptureForTesting* capture) {
  std::lock_guard<std::mutex> lock(capturesMu_);
  captures_.push_back(capture);
  captureCount_.fetch_add(1);
}

void Output::removeCapture(LogCaptureForTesting* capture) {
  std::lock_guard<std::mutex> lock(capturesMu_);
  auto it = std::find(captures_.begin(), captures_.end(), capture);
  if (it == captures_.end()) return;
  captures_.erase(it);
  captureCount_.fetch_sub(1);
}

bool Output::recordInCaptures(Level level, std::string_view subsystem, std::string_view category,
                              std::string_view message) {
  if (captureCount_.load() == 0) return true;
  std::lock_guard<std::mutex> lock(capturesMu_);
  bool echo = captures_.empty();
  for (LogCaptureForTesting* capture : captures_) {
    capture->record(level, subsystem, category, message);
    if (capture->echo() == CaptureEcho::AlsoStderr) echo = true;
  }
  return echo;
}

void Output::write(Level level, std::string_view subsystem, std::string_view category,
                   std::string_view message) {
  if (!recordInCaptures(level, subsystem, category, message)) return;
  LineOrigin origin;
  origin.processName = processName_;
  origin.pid = static_cast<long>(::getpid());
  origin.threadId = currentThreadId();
  ::clock_gettime(CLOCK_REALTIME, &origin.time);
  writeAll(fd_.load(), renderLine(form(), origin, level, subsystem, category, message));
}

}  // namespace platform::log::internal
