// The grants directory as last read: one cached reading per grant file, and
// the entitlements of every executable merged from them. refresh() lists the
// directory and stats its files; only files whose signature changed (or that
// changed too recently to trust the signature) are read again.
//
// Grants for one executable merge in byte order of their file names, key by
// key: where two files grant the same key, the later name's value wins.
//
// Thread safety: not thread-safe; LinuxEntitlementStore serialises calls.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <map>
#include <optional>
#include <string>
#include <unordered_map>
#include <vector>

#include "platform/codesign/internal/FileSignature.h"
#include "platform/values/Result.h"
#include "platform/vmap/Reader.h"

namespace platform::codesign::internal {

class GrantDirectory {
 public:
  // REQUIRES: directory is absolute.
  GrantDirectory(std::string directory, uid_t daemonUid, std::size_t maxFiles,
                 const vmap::ReadLimits& fileLimits);

  // Brings the merged grants up to date. A missing directory means no
  // grants. Fails when the directory cannot be listed or holds more than
  // maxFiles grant files; the merged grants are then empty, so that a
  // caller who ignores the error still grants nothing.
  Status refresh();

  // The merged entitlements of `canonicalExecutable`, or null.
  const Dictionary* entitlementsOf(const std::string& canonicalExecutable) const;

  // Grant files read (not answered from the cache) since construction.
  std::size_t readsForTesting() const { return reads_; }

 private:
  struct Grant {
    std::string executable;  // canonical
    Dictionary entitlements;
  };
  struct FileEntry {
    FileSignature signature;
    bool recent = false;
    std::optional<Grant> grant;  // none when the file was ignored
    std::string ignoredBecause;  // the logged reason, when ignored
  };

  // Lists the grant files; fails past maxFiles_.
  Result<std::vector<std::string>> listNames(int directoryFd) const;
  FileEntry readFile(int directoryFd, const std::string& name, const FileSignature& seen);
  void rebuildMerged();
  void clear();
  // Logs `failure` unless it is the one logged last; none resets.
  void noteFailure(const std::optional<Error>& failure);

  const std::string directory_;
  const uid_t daemonUid_;
  const std::size_t maxFiles_;
  const vmap::ReadLimits fileLimits_;

  // By name: std::string orders as unsigned bytes, which is the merge order.
  std::map<std::string, FileEntry> files_;
  std::unordered_map<std::string, Dictionary> merged_;
  std::string lastFailure_;
  std::size_t reads_ = 0;
};

}  // namespace platform::codesign::internal
