#include "platform/mbx/identity/internal/ClockTicks.h"

#include <time.h>
#include <unistd.h>

#include <cerrno>

namespace platform::mbx::internal {

Result<std::uint64_t> clockTicksSinceBoot() {
  const long hertz = ::sysconf(_SC_CLK_TCK);
  constexpr std::uint64_t kNanosPerSecond = 1'000'000'000;
  if (hertz <= 0 || kNanosPerSecond % static_cast<std::uint64_t>(hertz) != 0) {
    return Error::posix(EINVAL, "sysconf _SC_CLK_TCK");
  }
  struct timespec now {};
  if (::clock_gettime(CLOCK_BOOTTIME, &now) != 0) {
    return Error::posix(errno, "clock_gettime CLOCK_BOOTTIME");
  }
  const std::uint64_t nanos = static_cast<std::uint64_t>(now.tv_sec) * kNanosPerSecond +
                              static_cast<std::uint64_t>(now.tv_nsec);
  return nanos / (kNanosPerSecond / static_cast<std::uint64_t>(hertz));
}

}  // namespace platform::mbx::internal
