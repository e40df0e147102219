// One sandbox-extension token as the process that received it holds it:
// consuming takes up the access the token grants, expelling gives it back.
// A token is consumed at most once per object; destruction expels.
//
// Thread safety: token and handle have atomic accessors, but consume() and
// expel() are check-then-act sequences: one object must not be consumed or
// expelled from two threads at once.
#pragma once

#include <atomic>
#include <cstdint>
#include <memory>
#include <mutex>
#include <string>

#include "platform/sandbox/SandboxExtensions.h"

// The handle of an object whose token is not consumed.
inline constexpr std::int64_t QVSandboxExtensionNoHandle = -1;

class QVSandboxExtension {
 public:
  // `token` as issued, not yet consumed, taken up through `extensions`.
  // REQUIRES: extensions is not null.
  static std::shared_ptr<QVSandboxExtension> initWithExtension(
      std::string token, std::shared_ptr<platform::sandbox::SandboxExtensions> extensions);
  // The same through this process's Linux extensions, under the platform root.
  static std::shared_ptr<QVSandboxExtension> initWithExtension(std::string token);

  // REQUIRES: extensions is not null.
  QVSandboxExtension(std::string token,
                     std::shared_ptr<platform::sandbox::SandboxExtensions> extensions);
  virtual ~QVSandboxExtension();
  QVSandboxExtension(const QVSandboxExtension&) = delete;
  QVSandboxExtension& operator=(const QVSandboxExtension&) = delete;

  std::string token() const;
  void setToken(std::string token);
  std::int64_t handle() const { return handle_.load(); }
  void setHandle(std::int64_t handle) { handle_.store(handle); }

  // Consumes the token unless it already is; a refused token is logged and
  // stays unconsumed, so it may be tried again.
  void consume();
  // Releases a consumed token; afterwards the object is unconsumed whether
  // or not the release succeeded (a failure is logged).
  void expel();

  // Equal tokens; the handle does not take part.
  bool operator==(const QVSandboxExtension& other) const { return token() == other.token(); }

  std::string description() const;

 private:
  const std::shared_ptr<platform::sandbox::SandboxExtensions> extensions_;
  mutable std::mutex tokenMu_;
  std::string token_;
  std::atomic<std::int64_t> handle_{QVSandboxExtensionNoHandle};
};
