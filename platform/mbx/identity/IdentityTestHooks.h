// Seams in the taking of an identity, so that tests can reach the races it
// guards against on demand. Never used outside tests.
//
// Thread safety: a plain value; the hooks run on the thread taking the
// identity.
#pragma once

#include <sys/types.h>

#include <cstdint>
#include <functional>

namespace platform::mbx {

// Where the pidfd that pins the peer comes from.
enum class PidfdSource {
  // SO_PEERPIDFD where the kernel has it, else pidfd_open(pid) checked
  // against the start time.
  Automatic,
  // pidfd_open(pid) checked against the start time, as on kernels before 6.5.
  PidfdOpen,
};

// Which of the two reads of the start time a hook sees.
enum class StartTimeRead { First, Second };

struct IdentityTestHooks {
  PidfdSource pidfdSource = PidfdSource::Automatic;
  // Runs with the peer's pid once every fact has been read, before the checks
  // that they all came from the same, still running, process.
  std::function<void(pid_t)> betweenReads;
  // Sees each start time read and returns the one to use in its place.
  std::function<std::uint64_t(StartTimeRead, std::uint64_t)> startTime;
};

}  // namespace platform::mbx
