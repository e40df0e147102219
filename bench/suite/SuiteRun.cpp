// The helpers every bench_suite measurement shares: progress lines, paths in
// a synthetic root, figures as text, and starting qvd on a root.
#include "bench/suite/SuiteRun.h"

#include <cstdarg>
#include <cstdio>

#include "Quorvex/QVDConstants.h"
#include "platform/root/Root.h"

namespace bench::suite {

void progress(const char* format, ...) {
  va_list args;
  va_start(args, format);
  std::fprintf(stderr, "bench_suite: ");
  std::vfprintf(stderr, format, args);
  std::fprintf(stderr, "\n");
  va_end(args);
}

std::string bundlePath(const SyntheticRoot& root, std::size_t index) {
  return root.path() + "/System/Library/PlugIns/" +
         SyntheticRoot::pointName(index / root.plugInsPerPoint()) + "-" + std::to_string(index) +
         ".ovx";
}

std::string mib(long bytes) {
  char text[32];
  std::snprintf(text, sizeof text, "%.1f MiB", static_cast<double>(bytes) / 1048576.0);
  return text;
}

std::string ratio(double r) {
  char text[32];
  std::snprintf(text, sizeof text, "%.1fx", r);
  return text;
}

std::string latency(const std::vector<double>& samples) {
  return "median " + duration(percentile(samples, 0.5)) + ", p99 " +
         duration(percentile(samples, 0.99));
}

std::string socketPath(const SyntheticRoot& root) {
  return root.path() + "/run/quorvex/mbx/" + std::string(QVDServiceName);
}

// Starts qvd on `root` and waits until it accepts connections.
bool start(const SyntheticRoot& root, Session& session) {
  platform::setRootDirectoryForTesting(root.path());
  auto daemon = bench::match::DaemonProcess::start(QVD_PATH, root.path());
  if (!daemon.ok()) {
    progress("%s", daemon.error().description().c_str());
    return false;
  }
  session.daemon.emplace(std::move(*daemon));
  auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
  if (!client.ok()) return false;
  session.client = *client;
  return true;
}

}  // namespace bench::suite
