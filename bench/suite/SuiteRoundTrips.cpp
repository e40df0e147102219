// Measures "find" round trips next to a raw Unix-socket ping-pong and a D-Bus
// method call of the same bytes, pinned to one CPU and then free.
#include <cstdio>

#include "Quorvex/QVDConstants.h"
#include "bench/suite/EchoPeers.h"
#include "bench/suite/SuiteRun.h"
#include "platform/mbx/Frame.h"

namespace bench::suite {

using platform::Dictionary;
using platform::Value;

bool Suite::roundTrips(Session& session) {
  // The sizes the raw and D-Bus peers send: those of a find request and of
  // its reply (a plug-in form) as mbx frames.
  const platform::Uuid& probe = uuids_.front();
  Dictionary request = session.client->request(QVDFindRequest);
  request.set(QVDUUIDKey, Value(probe));
  Value reply;
  if (!findByUuid(*session.client, probe, &reply)) return false;
  auto requestFrame =
      platform::mbx::encodeFrame(platform::mbx::FrameKind::Request, 0, Value(request));
  auto replyFrame = platform::mbx::encodeFrame(platform::mbx::FrameKind::Reply, 1, reply);
  if (!requestFrame.ok() || !replyFrame.ok()) return false;
  const std::size_t requestBytes = requestFrame->size();
  const std::size_t replyBytes = replyFrame->size();

  const std::string self = selfPath();
  const std::string rawPath = base_ + "/raw.sock";
  auto rawPeer = Helper::start(
      {self, "--raw-echo", rawPath, std::to_string(requestBytes), std::to_string(replyBytes)});
  if (!rawPeer.ok() || (*rawPeer)->readLine(10) != "ready") return false;
  auto raw = RawPingPong::connect(rawPath, requestBytes, replyBytes);
  if (!raw.ok()) return false;

  std::unique_ptr<PrivateBus> bus;
  std::unique_ptr<Helper> echo;
  std::unique_ptr<DBusCaller> caller;
  std::string dbusProblem;
  if (!dbusAvailable()) {
    dbusProblem = "not measured: built without libdbus-1-dev";
  } else if (auto started = PrivateBus::start(base_); !started.ok()) {
    dbusProblem = "not measured: " + started.error().description();
  } else {
    bus = std::move(*started);
    auto service = Helper::start({self, "--dbus-echo", bus->address(), std::to_string(replyBytes)});
    if (!service.ok() || (*service)->readLine(10) != "ready") {
      dbusProblem = "not measured: the echo service did not start";
    } else {
      echo = std::move(*service);
      auto connected = DBusCaller::connect(bus->address(), requestBytes);
      if (connected.ok()) {
        caller = std::move(*connected);
      } else {
        dbusProblem = "not measured: " + connected.error().description();
      }
    }
  }

  std::vector<pid_t> processes{0, session.pid(), (*rawPeer)->pid()};
  if (caller) {
    processes.push_back(bus->pid());
    processes.push_back(echo->pid());
  }
  auto affinity = [&](const cpu_set_t& cpus) {
    for (pid_t pid : processes) setProcessAffinity(pid, cpus);
  };

  struct Samples {
    std::vector<double> raw, find, syncFind, dbus;
  };
  bool ok = true;
  // Rounds of each kind in turn, so that whatever else the machine does
  // falls on all three alike.
  auto measure = [&](int rounds, int perRound, Samples& samples) {
    for (int i = 0; i < 300; ++i) {
      ok = ok && (*raw)->once() && findByUuid(*session.client, uuids_[random_() % uuids_.size()]) &&
           findByUuidSynchronously(*session.client, uuids_[random_() % uuids_.size()]) &&
           (!caller || caller->once());
    }
    for (int round = 0; round < rounds && ok; ++round) {
      for (int i = 0; i < perRound && ok; ++i) {
        samples.raw.push_back(secondsOf([&] { ok = (*raw)->once(); }));
      }
      for (int i = 0; i < perRound && ok; ++i) {
        const platform::Uuid& uuid = uuids_[random_() % uuids_.size()];
        samples.find.push_back(secondsOf([&] { ok = findByUuid(*session.client, uuid); }));
      }
      for (int i = 0; i < perRound && ok; ++i) {
        const platform::Uuid& uuid = uuids_[random_() % uuids_.size()];
        samples.syncFind.push_back(
            secondsOf([&] { ok = findByUuidSynchronously(*session.client, uuid); }));
      }
      for (int i = 0; caller && i < perRound && ok; ++i) {
        samples.dbus.push_back(secondsOf([&] { ok = caller->once(); }));
      }
    }
  };
  const cpu_set_t all = allowedCpus();
  // Everything on one CPU: in a VM, waking an idle second vCPU costs tens
  // of microseconds per hop, which would swamp what is measured.
  Samples pinned;
  affinity(firstCpu());
  measure(5, 2'000, pinned);
  affinity(all);
  Samples spread;
  measure(3, 1'000, spread);
  if (!ok) {
    progress("a round trip failed");
    return false;
  }

  char sizes[96];
  std::snprintf(sizes, sizeof sizes, "%zu-byte request, %zu-byte reply", requestBytes, replyBytes);
  table_.at(1);
  table_.heading(std::string("1. \"find\" by UUID through QVDaemonClient, round trip (") + sizes +
                 "; 10,000 of each kind, every process on one CPU)");
  const double rawMedian = percentile(pinned.raw, 0.5);
  const double dbus = caller ? percentile(pinned.dbus, 0.5) : 0;
  table_.row("raw Unix-socket ping-pong, same bytes (the limit)", latency(pinned.raw));
  if (caller) {
    table_.row("D-Bus method call, same bytes (libdbus-1, private dbus-daemon)",
               latency(pinned.dbus));
  } else {
    table_.row("D-Bus method call", dbusProblem, "", "", "not measured");
  }
  // Both ways a host can wait for a find: each is held to both targets.
  struct Find {
    const char* name;
    const char* how;
    const std::vector<double>* samples;
  };
  const Find finds[] = {
      {"find, asynchronous", " (findPlugInByUUID; the caller waits for the reply handler)",
       &pinned.find},
      {"find, synchronous", " (sendSynchronously; the caller reads the reply itself)",
       &pinned.syncFind}};
  for (const Find& f : finds) {
    const double find = percentile(*f.samples, 0.5);
    table_.row(std::string(f.name) + f.how, latency(*f.samples),
               ratio(find / rawMedian) + " the raw ping-pong", "<= 3x raw",
               table_.verdict(find <= 3 * rawMedian));
    if (caller) {
      table_.row(std::string(f.name) + " against the D-Bus call", "",
                 "takes " + ratio(find / dbus) + " the call's time", "faster",
                 table_.verdict(find < dbus));
    }
  }
  table_.heading("1b. the same, processes free to use both CPUs (3,000 each)");
  const double spreadRaw = percentile(spread.raw, 0.5);
  table_.row("raw Unix-socket ping-pong", latency(spread.raw));
  if (caller) table_.row("D-Bus method call", latency(spread.dbus));
  table_.row("find, asynchronous", latency(spread.find),
             ratio(percentile(spread.find, 0.5) / spreadRaw) + " the raw ping-pong");
  table_.row("find, synchronous", latency(spread.syncFind),
             ratio(percentile(spread.syncFind, 0.5) / spreadRaw) + " the raw ping-pong");
  return true;
}

}  // namespace bench::suite
