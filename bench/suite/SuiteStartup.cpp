// Measures qvd's start-up on the 10,000 root (first start and restarts), its
// memory idle and with every plug-in cached, and per idle connection; and
// writes the synthetic roots.
#include <errno.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstring>
#include <thread>

#include "bench/suite/SuiteRun.h"

namespace bench::suite {

using platform::Dictionary;

bool Suite::makeRoots(bool largeOnly) {
  for (std::size_t n : kSizes) {
    if (largeOnly && n != kLarge) continue;
    const double took = secondsOf([&] {
      auto root = SyntheticRoot::make(base_ + "/root" + std::to_string(n), n, n / kPerPoint);
      if (root.ok()) {
        roots_.emplace(n, std::move(*root));
      } else {
        progress("root: %s", root.error().description().c_str());
      }
    });
    if (!roots_.contains(n)) return false;
    progress("root of %zu plug-ins written in %.2f s", n, took);
  }
  return true;
}

bool Suite::timedStart(Session& session, double& seconds) {
  const SyntheticRoot& root = roots_.at(kLarge);
  const auto begin = Clock::now();
  if (!start(root, session)) return false;
  if (!findByPath(*session.client, bundlePath(root, 0))) return false;
  seconds = since(begin);
  return true;
}

// Every point's match once: every plug-in object is then cached, and the
// UUIDs are known.
bool Suite::cacheEverything(Session& session) {
  const SyntheticRoot& root = roots_.at(kLarge);
  uuids_.clear();
  for (std::size_t p = 0; p < root.points(); ++p) {
    const Dictionary rules{{"XOExtensionPointName", SyntheticRoot::pointName(p)}};
    if (match(*session.client, rules, &uuids_) != static_cast<long>(kPerPoint)) return false;
  }
  return uuids_.size() == kLarge;
}

bool Suite::idleConnections(Session& session) {
  constexpr std::size_t kConnections = 1'000;
  const pid_t pid = session.pid();
  const long descriptorsBefore = openDescriptors(pid);
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  const long before = residentBytes(pid);
  const std::string path = socketPath(roots_.at(kLarge));
  sockaddr_un address{};
  address.sun_family = AF_UNIX;
  std::strncpy(address.sun_path, path.c_str(), sizeof address.sun_path - 1);
  std::vector<int> fds;
  for (std::size_t i = 0; i < kConnections; ++i) {
    const int fd = ::socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0 || ::connect(fd, reinterpret_cast<sockaddr*>(&address), sizeof address) != 0) {
      progress("connection %zu: %s", i, std::strerror(errno));
      if (fd >= 0) ::close(fd);
      break;
    }
    fds.push_back(fd);
  }
  // Accepted once the daemon holds a descriptor for each.
  const auto deadline = Clock::now() + std::chrono::seconds(30);
  while (openDescriptors(pid) < descriptorsBefore + static_cast<long>(fds.size()) &&
         Clock::now() < deadline) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  const bool accepted = openDescriptors(pid) >= descriptorsBefore + static_cast<long>(fds.size());
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  const long after = residentBytes(pid);
  connections_ = fds.size();
  perConnection_ = fds.empty() ? 0 : static_cast<double>(after - before) / static_cast<double>(fds.size());
  for (int fd : fds) ::close(fd);
  const auto gone = Clock::now() + std::chrono::seconds(30);
  while (openDescriptors(pid) > descriptorsBefore && Clock::now() < gone) {
    std::this_thread::sleep_for(std::chrono::milliseconds(10));
  }
  if (!accepted) progress("the daemon did not take all %zu connections", fds.size());
  return accepted && fds.size() == kConnections;
}

bool Suite::largeRoot() {
  const SyntheticRoot& root = roots_.at(kLarge);
  {
    // The first start registers every bundle of the fresh root.
    Session session;
    if (!timedStart(session, firstStart_)) return false;
    progress("first start on 10,000: %.2f s", firstStart_);
    if (!matchAt(kLarge, session, matches_[kLarge])) return false;
  }
  Session session;
  for (int i = 0; i < 5; ++i) {
    session.stop();
    double seconds = 0;
    if (!timedStart(session, seconds)) return false;
    restarts_.push_back(seconds);
  }
  progress("restart: %.2f s", percentile(restarts_, 0.5));
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  idleResident_ = residentBytes(session.pid());
  if (!cacheEverything(session)) {
    progress("could not match every extension point");
    return false;
  }
  std::this_thread::sleep_for(std::chrono::milliseconds(300));
  cachedResident_ = residentBytes(session.pid());
  if (!idleConnections(session)) return false;
  progress("memory measured");
  if (!roundTrips(session)) return false;
  progress("round trips measured");
  if (!throughput(session)) return false;
  (void)root;
  return true;
}

}  // namespace bench::suite
