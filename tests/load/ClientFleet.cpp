#include "tests/load/ClientFleet.h"

#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <numeric>
#include <random>

namespace qvd::load {

ClientFleet::ClientFleet(int count, const std::function<int(int)>& body) {
  // Whatever this process has buffered must not be written again by each child.
  std::fflush(nullptr);
  for (int i = 0; i < count; ++i) {
    const pid_t pid = ::fork();
    if (pid == 0) {
      ::setpgid(0, group_);
      ::_exit(body(i));
    }
    if (pid < 0) break;
    // Set on both sides, so that it holds whichever runs first.
    if (group_ == 0) group_ = pid;
    ::setpgid(pid, group_);
    indexOf_[pid] = i;
    pids_.push_back(pid);
  }
  status_.assign(pids_.size(), -1);
  running_ = static_cast<int>(pids_.size());
}

ClientFleet::~ClientFleet() {
  killAll();
}

void ClientFleet::chooseVictims(int count, std::uint32_t lastPoint, unsigned seed) {
  std::mt19937 random(seed);
  std::vector<int> order(pids_.size());
  std::iota(order.begin(), order.end(), 0);
  std::shuffle(order.begin(), order.end(), random);
  order.resize(std::min<std::size_t>(order.size(), static_cast<std::size_t>(count)));
  for (int index : order) {
    victims_[index] =
        Victim{std::uniform_int_distribution<std::uint32_t>(1, lastPoint)(random),
               std::chrono::microseconds(std::uniform_int_distribution<int>(0, 5000)(random)),
               {}};
  }
}

void ClientFleet::tend(const std::function<std::uint32_t(int)>& progress) {
  const auto now = std::chrono::steady_clock::now();
  for (auto& [index, victim] : victims_) {
    if (victim.killed || status_[index] != -1) continue;
    if (!victim.killAt && progress(index) >= victim.point) victim.killAt = now + victim.delay;
    if (victim.killAt && now >= *victim.killAt) {
      ::kill(pids_[index], SIGKILL);
      victim.killed = true;
    }
  }
  reap(false);
}

void ClientFleet::killAll() {
  for (std::size_t i = 0; i < pids_.size(); ++i) {
    if (status_[i] == -1) ::kill(pids_[i], SIGKILL);
  }
  reap(true);
}

void ClientFleet::reap(bool block) {
  int raw = 0;
  for (pid_t done; running_ > 0 && (done = ::waitpid(-group_, &raw, block ? 0 : WNOHANG)) > 0;) {
    status_[indexOf_[done]] = WIFEXITED(raw) ? WEXITSTATUS(raw) : 128 + WTERMSIG(raw);
    --running_;
  }
}

}  // namespace qvd::load
