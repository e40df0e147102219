// Sandbox extensions on Linux, where no kernel mechanism carries them: a
// token is a signed statement of what it grants (see SandboxToken.h), signed
// with HMAC-SHA-256 under a key kept in <root>/run/quorvex/sandbox/key and
// made at first use. Consuming checks the signature and records the grant in
// this process's handle table, where the process's own code can ask for it
// (grantForHandle). Only processes that can read the key can issue or verify,
// which on one system means the key's owner.
//
// Thread safety: safe from any thread; the key is loaded once under a lock
// (a failed load is tried again on the next call).
#pragma once

#include <cstdint>
#include <mutex>
#include <optional>
#include <string>
#include <string_view>

#include "platform/sandbox/SandboxExtensions.h"
#include "platform/sandbox/SandboxToken.h"
#include "platform/sandbox/TokenSigner.h"

namespace platform::sandbox {

// Where the key lies, relative to the platform root.
inline constexpr std::string_view kSigningKeyRelativePath = "run/quorvex/sandbox/key";

class LinuxSandboxExtensions final : public SandboxExtensions {
 public:
  // The key under the platform root.
  LinuxSandboxExtensions();
  explicit LinuxSandboxExtensions(std::string keyPath);

  // Canonicalise resolves the path with realpath, so it must exist (ENOENT
  // otherwise). Paths past 4095 bytes fail with ENAMETOOLONG.
  Result<std::string> issueFileExtension(std::string_view path,
                                         PathResolution resolution) const override;
  Result<std::string> issueServiceExtension(std::string_view extensionClass,
                                            std::string_view serviceName) const override;
  Result<std::int64_t> consume(std::string_view token) override;
  Status release(std::int64_t handle) override;

  // What a live handle of this process grants; none for any other number.
  static std::optional<ExtensionGrant> grantForHandle(std::int64_t handle);

  const std::string& keyPath() const { return keyPath_; }

 private:
  Result<std::string> issue(const ExtensionGrant& grant) const;
  // The signer for the key, loading (or making) the key on first use.
  Result<TokenSigner> signer() const;

  const std::string keyPath_;
  mutable std::mutex mu_;
  mutable std::optional<TokenSigner> signer_;
};

}  // namespace platform::sandbox
