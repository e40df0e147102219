// The external services LinuxServiceManager has recorded:
// <records>/<host pid>/<bundle identifier>.vmap holding
// {executable, overlay}. Host directories and record files are bounded
// when read back, since the directory outlives the processes it names.
//
// Thread safety: free functions over the file system; safe from any thread
// (two writers of one record each leave a whole file).
#pragma once

#include <cstddef>
#include <set>
#include <string>
#include <string_view>

#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"

namespace platform::lumend::internal {

// Whether `identifier` can name a record file: one path component of at
// most 250 bytes, not "." or "..", not starting with '.' (temporary files
// of atomic writes are hidden).
bool isRecordableBundleIdentifier(std::string_view identifier);

// Writes the record of `bundleIdentifier` for `hostPid`, replacing any.
Status writeServiceRecord(const std::string& records, int hostPid,
                          const std::string& bundleIdentifier, const std::string& executable,
                          const Dictionary& overlay);

// The executables recorded for `bundleIdentifier`, over at most
// `maxHosts` host directories.
std::set<std::string> recordedExecutables(const std::string& records,
                                          const std::string& bundleIdentifier,
                                          std::size_t maxHosts);

// Removes every record of `bundleIdentifier` (at most `maxHosts` host
// directories looked at); a host directory left empty goes too. The number
// of records removed.
std::size_t dropServiceRecords(const std::string& records, const std::string& bundleIdentifier,
                               std::size_t maxHosts);

}  // namespace platform::lumend::internal
