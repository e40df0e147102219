// The extensions this process has consumed, by handle. One table serves the
// whole process, so that handles stay unique whichever SandboxExtensions
// object handed them out.
//
// Thread safety: safe from any thread; every member takes the table's lock.
#pragma once

#include <cstddef>
#include <cstdint>
#include <map>
#include <mutex>
#include <optional>

#include "platform/sandbox/SandboxToken.h"
#include "platform/values/Result.h"

namespace platform::sandbox::internal {

// A process that consumes without ever releasing is refused past this many.
inline constexpr std::size_t kMaxLiveHandles = 65536;

class HandleTable {
 public:
  // Never destroyed, so that releasing during exit stays safe.
  static HandleTable& shared();

  // A new handle for `grant`: 1 for the first, then counting up; a number is
  // never given twice in a process. Fails with EMFILE when full.
  Result<std::int64_t> add(ExtensionGrant grant);

  // Fails with EBADF for a handle that is not live.
  Status remove(std::int64_t handle);

  std::optional<ExtensionGrant> find(std::int64_t handle) const;
  std::size_t size() const;

 private:
  HandleTable() = default;

  mutable std::mutex mu_;
  std::int64_t next_ = 1;
  std::map<std::int64_t, ExtensionGrant> live_;
};

}  // namespace platform::sandbox::internal
