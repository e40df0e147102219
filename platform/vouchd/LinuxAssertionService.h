// Busy assertions on Linux: a process is a busy instance of bundle B while
// it holds an exclusive flock on <root>/run/quorvex/assertions/B/<its pid>.
// The lock, not the file, is the assertion: a file left behind by a process
// that died (or that released its lock) does not count, and the kernel drops
// the lock when the process ends, however it ends.
//
// The directory is written by plug-in processes, so it is untrusted input:
// entries whose names are not process ids, that are not regular files or
// that are symbolic links are skipped, and at most `maxEntriesPerBundle`
// entries of one bundle's directory are looked at (the rest are logged and
// ignored).
//
// Thread safety: safe from any thread; no state changes after construction.
#pragma once

#include <cstddef>
#include <string>

#include "platform/vouchd/AssertionService.h"

namespace platform::vouchd {

struct AssertionLimits {
  std::size_t maxEntriesPerBundle = 4096;
};

class LinuxAssertionService final : public AssertionService {
 public:
  // Assertions in rootPath("run/quorvex/assertions").
  LinuxAssertionService();
  // REQUIRES: directory is absolute.
  explicit LinuxAssertionService(std::string directory, AssertionLimits limits = {});

  Result<std::vector<ExtensionInstance>> busyExtensionInstances(
      const std::set<std::string>& bundleIdentifiers) const override;

  const std::string& directory() const { return directory_; }

 private:
  // Appends the busy instances of one bundle.
  Status collect(const std::string& bundleIdentifier,
                 std::vector<ExtensionInstance>& instances) const;

  const std::string directory_;
  const AssertionLimits limits_;
};

}  // namespace platform::vouchd
