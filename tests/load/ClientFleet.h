// The client processes of the load test: forked from the test, a chosen few
// killed with SIGKILL once each has got a random number of replies, and
// every one reaped with its exit status.
//
// Thread safety: none; the test's main thread drives it.
#pragma once

#include <sys/types.h>

#include <chrono>
#include <cstdint>
#include <functional>
#include <map>
#include <optional>
#include <vector>

namespace qvd::load {

class ClientFleet {
 public:
  // Forks `count` children; child i runs body(i) and exits with its result
  // (never returning into the test). Stops at the first failed fork.
  ClientFleet(int count, const std::function<int(int)>& body);
  // Kills and reaps whatever still runs.
  ~ClientFleet();
  ClientFleet(const ClientFleet&) = delete;
  ClientFleet& operator=(const ClientFleet&) = delete;

  int forked() const { return static_cast<int>(pids_.size()); }
  // Picks `count` victims with `seed`; each is killed a random 0-5 ms after
  // its progress first reaches a random point in [1, lastPoint].
  void chooseVictims(int count, std::uint32_t lastPoint, unsigned seed);
  // Kills the victims whose time has come, `progress(i)` being client i's,
  // and reaps the clients that ended.
  void tend(const std::function<std::uint32_t(int)>& progress);
  // Ends every client still running.
  void killAll();

  int running() const { return running_; }
  bool isVictim(int index) const { return victims_.count(index) != 0; }
  // -1 while it runs; its exit status, or 128 + the signal that ended it.
  int status(int index) const { return status_[index]; }

 private:
  struct Victim {
    std::uint32_t point;
    std::chrono::microseconds delay;
    std::optional<std::chrono::steady_clock::time_point> killAt;
    bool killed = false;
  };
  void reap(bool block);

  // The clients form a process group of their own, so that waiting for any
  // of them never reaps the daemon, which is a child of this process too.
  pid_t group_ = 0;
  std::vector<pid_t> pids_;
  std::map<pid_t, int> indexOf_;
  std::vector<int> status_;
  std::map<int, Victim> victims_;
  int running_ = 0;
};

}  // namespace qvd::load
