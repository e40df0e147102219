#include "Quorvex/QVSandboxExtension.h"

#include <cassert>
#include <utility>

#include "Quorvex/QVLog.h"
#include "platform/sandbox/LinuxSandboxExtensions.h"

namespace {

// Made on first use and kept for the life of the process, as the handle
// table it fronts is.
const std::shared_ptr<platform::sandbox::SandboxExtensions>& processExtensions() {
  static const auto* extensions = new std::shared_ptr<platform::sandbox::SandboxExtensions>(
      std::make_shared<platform::sandbox::LinuxSandboxExtensions>());
  return *extensions;
}

}  // namespace

std::shared_ptr<QVSandboxExtension> QVSandboxExtension::initWithExtension(
    std::string token, std::shared_ptr<platform::sandbox::SandboxExtensions> extensions) {
  return std::make_shared<QVSandboxExtension>(std::move(token), std::move(extensions));
}

std::shared_ptr<QVSandboxExtension> QVSandboxExtension::initWithExtension(std::string token) {
  return initWithExtension(std::move(token), processExtensions());
}

QVSandboxExtension::QVSandboxExtension(
    std::string token, std::shared_ptr<platform::sandbox::SandboxExtensions> extensions)
    : extensions_(std::move(extensions)), token_(std::move(token)) {
  assert(extensions_ != nullptr);
}

QVSandboxExtension::~QVSandboxExtension() { expel(); }

std::string QVSandboxExtension::token() const {
  std::lock_guard<std::mutex> lock(tokenMu_);
  return token_;
}

void QVSandboxExtension::setToken(std::string token) {
  std::lock_guard<std::mutex> lock(tokenMu_);
  token_ = std::move(token);
}

void QVSandboxExtension::consume() {
  if (handle() != QVSandboxExtensionNoHandle) return;
  const std::string current = token();
  platform::Result<std::int64_t> consumed = extensions_->consume(current);
  if (!consumed.ok()) {
    QVLogSandbox().notice("failed to consume extension %s - errno=%d", current,
                          platform::sandbox::sandboxErrno(consumed.error()));
    return;
  }
  setHandle(*consumed);
  QVLogSandbox().debug("consuming extension %s -> %ld", current, *consumed);
}

void QVSandboxExtension::expel() {
  const std::int64_t current = handle();
  if (current == QVSandboxExtensionNoHandle) return;
  platform::Status released = extensions_->release(current);
  if (released.ok()) {
    QVLogSandbox().debug("releasing extension %ld", current);
  } else {
    QVLogSandbox().notice("failed to release extension %ld - errno=%d", current,
                          platform::sandbox::sandboxErrno(released.error()));
  }
  setHandle(QVSandboxExtensionNoHandle);
}

std::string QVSandboxExtension::description() const {
  return "<QVSandboxExtension handle=" + std::to_string(handle()) + ">";
}
