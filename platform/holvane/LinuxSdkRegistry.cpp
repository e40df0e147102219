#include "platform/holvane/LinuxSdkRegistry.h"

#include <errno.h>

#include <utility>

#include "platform/holvane/HolvaneError.h"
#include "platform/root/Root.h"

namespace platform::holvane {
namespace {

Error invalidIdentifier(std::string_view identifier, std::string_view why) {
  return holvaneError(HolvaneErrorCode::InvalidIdentifier, "invalid extension point identifier \"" +
                                                               std::string(identifier) +
                                                               "\": " + std::string(why));
}

}  // namespace

std::optional<Error> checkExtensionPointIdentifier(std::string_view identifier) {
  if (identifier.empty()) return invalidIdentifier(identifier, "empty");
  if (identifier.size() > kMaxExtensionPointIdentifierBytes) {
    // Do not echo a huge identifier back into logs.
    return invalidIdentifier(
        identifier.substr(0, 32),
        "longer than " + std::to_string(kMaxExtensionPointIdentifierBytes) + " bytes");
  }
  if (identifier.find('\0') != std::string_view::npos) {
    return invalidIdentifier("", "contains a NUL byte");
  }
  if (identifier.find('/') != std::string_view::npos) {
    return invalidIdentifier(identifier, "contains '/'");
  }
  if (identifier.find("..") != std::string_view::npos) {
    return invalidIdentifier(identifier, "contains '..'");
  }
  if (identifier.front() == '.') return invalidIdentifier(identifier, "starts with '.'");
  return std::nullopt;
}

LinuxSdkRegistry::LinuxSdkRegistry()
    : LinuxSdkRegistry(rootPath("System/Library/ExtensionPoints")) {}

LinuxSdkRegistry::LinuxSdkRegistry(std::string directory, vmap::ReadLimits limits)
    : directory_(std::move(directory)), limits_(limits) {}

Result<std::optional<Dictionary>> LinuxSdkRegistry::sdkDictionary(
    std::string_view extensionPointIdentifier) const {
  if (auto invalid = checkExtensionPointIdentifier(extensionPointIdentifier)) return *invalid;
  const std::string path = directory_ + "/" + std::string(extensionPointIdentifier) + ".vmap";
  Result<Value> read = vmap::readFile(path, limits_);
  if (!read.ok()) {
    const Error& error = read.error();
    // A missing file, or a missing directory on the way to it, is an
    // extension point that registered nothing.
    if (error.is(kPosixErrorDomain, ENOENT) || error.is(kPosixErrorDomain, ENOTDIR)) {
      return std::optional<Dictionary>();
    }
    return error;
  }
  const Dictionary* dictionary = read->dictionary();
  if (dictionary == nullptr) {
    return holvaneError(
        HolvaneErrorCode::Malformed,
        path + ": holds a " + valueTypeName(read->type()) + ", not an SDK dictionary");
  }
  return std::optional<Dictionary>(*dictionary);
}

}  // namespace platform::holvane
