// Entitlements as granted on disk. A grant is a vmap file in the grants
// directory (<root>/etc/quorvex/entitlements/*.vmap) holding a dictionary
// {executable: "/abs/path", entitlements: {...}}; a bundle declares its own
// in <bundle>/Entitlements.vmap. Only files that pass the trust rule
// (FileTrust.h) count; an untrusted or malformed file is ignored and the
// reason logged (category "codesign" of "com.corvane.platform").
//
// Every question lists the grants directory and stats its files, so edits
// take effect at once; only changed files are read again. Several grants for
// one executable merge key by key, the later file name (in byte order)
// winning. Executable paths are compared after realpath on both sides; a
// grant's path is resolved when its file is read.
//
// Thread safety: safe to call from any thread; calls are serialised inside.
#pragma once

#include <sys/types.h>

#include <cstddef>
#include <mutex>
#include <string>
#include <string_view>

#include "platform/codesign/EntitlementStore.h"
#include "platform/codesign/internal/GrantDirectory.h"
#include "platform/vmap/Reader.h"

namespace platform::codesign {

struct EntitlementLimits {
  // More grant files than this and no question is answered: a directory
  // that big is a fault, and answering from part of it could grant the
  // wrong thing.
  std::size_t maxGrantFiles = 1000;
  // Per file (grant or bundle entitlements).
  vmap::ReadLimits file{.maxBytes = 1u << 20, .maxDepth = 32, .maxItems = 100'000};
};

class LinuxEntitlementStore final : public EntitlementStore {
 public:
  // Grants from rootPath("etc/quorvex/entitlements"); files owned by root or
  // by this process's effective uid are trusted.
  LinuxEntitlementStore();
  // REQUIRES: grantsDirectory is absolute.
  LinuxEntitlementStore(std::string grantsDirectory, uid_t daemonUid,
                        EntitlementLimits limits = {});

  Result<Dictionary> entitlementsOfExecutable(std::string_view executablePath) const override;
  Result<Dictionary> entitlementsOfBundle(std::string_view bundlePath) const override;

  // Grant files read from disk so far, cache hits not counted.
  std::size_t grantFileReadsForTesting() const;

 private:
  const uid_t daemonUid_;
  const EntitlementLimits limits_;
  mutable std::mutex mu_;
  mutable internal::GrantDirectory grants_;  // guarded by mu_
};

}  // namespace platform::codesign
