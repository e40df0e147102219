// Measures requests per second with 1, 4 and 16 client threads alternating
// find and one-extension-point match, with qvd's CPU use.
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <thread>

#include "Quorvex/QVDConstants.h"
#include "bench/suite/SuiteRun.h"

namespace bench::suite {

using platform::Dictionary;

bool Suite::throughput(Session& session) {
  const std::size_t points = roots_.at(kLarge).points();
  constexpr double kWarm = 0.5;
  constexpr double kWindow = 5.0;
  struct Level {
    int clients;
    double perSecond;
    double median;
    double findMedian;
    double matchMedian;
    double daemonCpu;
  };
  std::vector<Level> levels;
  for (int clients : {1, 4, 16}) {
    std::vector<std::shared_ptr<QVDaemonClient>> connections;
    for (int i = 0; i < clients; ++i) {
      auto client = QVDaemonClient::initWithServiceName(std::string(QVDServiceName));
      if (!client.ok()) return false;
      connections.push_back(*client);
    }
    std::atomic<bool> stop{false};
    std::atomic<long> failures{0};
    struct Done {
      double end;
      double took;
      bool find;
    };
    std::vector<std::vector<Done>> done(static_cast<std::size_t>(clients));
    const auto begin = Clock::now();
    std::vector<std::thread> threads;
    for (int t = 0; t < clients; ++t) {
      threads.emplace_back([&, t] {
        std::mt19937 random(static_cast<unsigned>(t) * 7919u + 1u);
        QVDaemonClient& client = *connections[static_cast<std::size_t>(t)];
        for (long i = 0; !stop.load(std::memory_order_relaxed); ++i) {
          const auto sent = Clock::now();
          bool ok;
          if (i % 2 == 0) {
            ok = findByUuid(client, uuids_[random() % uuids_.size()]);
          } else {
            const Dictionary rules{{"XOExtensionPointName", SyntheticRoot::pointName(random() % points)}};
            ok = match(client, rules) == static_cast<long>(kPerPoint);
          }
          if (!ok) ++failures;
          done[static_cast<std::size_t>(t)].push_back({since(begin), since(sent), i % 2 == 0});
        }
      });
    }
    std::this_thread::sleep_until(begin + std::chrono::milliseconds(static_cast<int>(kWarm * 1e3)));
    const double cpuBefore = cpuSeconds(session.pid());
    std::this_thread::sleep_until(begin + std::chrono::milliseconds(static_cast<int>((kWarm + kWindow) * 1e3)));
    const double cpuAfter = cpuSeconds(session.pid());
    stop = true;
    for (std::thread& thread : threads) thread.join();
    if (failures.load() != 0) {
      progress("%ld requests failed with %d clients", failures.load(), clients);
      return false;
    }
    std::vector<double> latencies, finds, matches;
    for (const auto& one : done) {
      for (const Done& request : one) {
        if (request.end < kWarm || request.end >= kWarm + kWindow) continue;
        latencies.push_back(request.took);
        (request.find ? finds : matches).push_back(request.took);
      }
    }
    levels.push_back({clients, static_cast<double>(latencies.size()) / kWindow,
                      percentile(latencies, 0.5), percentile(finds, 0.5),
                      percentile(matches, 0.5), (cpuAfter - cpuBefore) / kWindow});
    progress("%d clients: %.0f requests/s", clients, levels.back().perSecond);
  }

  table_.at(3);
  table_.heading("3. throughput: find (UUID) and match (one extension point) alternating, 10,000 "
                 "plug-ins, client threads in one process, 5 s each");
  for (std::size_t i = 0; i < levels.size(); ++i) {
    const Level& level = levels[i];
    char cpu[64];
    std::snprintf(cpu, sizeof cpu, "; qvd used %.0f%% of a CPU", level.daemonCpu * 100);
    std::string against = "median " + duration(level.median) + " per request (find " +
                          duration(level.findMedian) + ", match " +
                          duration(level.matchMedian) + ")" + cpu;
    if (i > 0) against += "; " + ratio(level.perSecond / levels[i - 1].perSecond) + " the rate of " +
                          std::to_string(levels[i - 1].clients);
    table_.row(std::to_string(level.clients) + (level.clients == 1 ? " client" : " clients"),
               grouped(level.perSecond) + " requests/s", against);
  }
  // Saturated where more clients no longer buy a tenth more requests.
  std::string where = "not saturated by 16 clients";
  for (std::size_t i = 1; i < levels.size(); ++i) {
    if (levels[i].perSecond < 1.1 * levels[i - 1].perSecond) {
      char text[200];
      std::snprintf(text, sizeof text,
                    "saturated at %d client%s: %d give %.2fx the rate; qvd at %.0f%% of a CPU "
                    "(its service queue runs one request at a time), the machine has %ld",
                    levels[i - 1].clients, levels[i - 1].clients == 1 ? "" : "s",
                    levels[i].clients,
                    levels[i].perSecond / levels[i - 1].perSecond, levels[i].daemonCpu * 100,
                    ::sysconf(_SC_NPROCESSORS_ONLN));
      where = text;
      break;
    }
  }
  table_.row("where the service queue saturates", where);
  return true;
}

}  // namespace bench::suite
