#include "platform/holvane/internal/RecordBuilder.h"

#include <errno.h>
#include <limits.h>
#include <stdlib.h>
#include <sys/stat.h>

#include <memory>

#include "platform/bundle/Bundle.h"
#include "platform/holvane/ManifestMerge.h"
#include "platform/holvane/RegistryError.h"
#include "platform/holvane/internal/HolvaneLog.h"

namespace platform::holvane::internal {
namespace {

std::optional<std::string> realPath(const std::string& path) {
  std::unique_ptr<char, decltype(&::free)> resolved(::realpath(path.c_str(), nullptr), &::free);
  if (!resolved) return std::nullopt;
  return std::string(resolved.get());
}

// A file name's limit, less room for the temporary names of tools.
constexpr std::size_t kMaxContainerNameBytes = 250;

Error refused(const std::string& path, std::string_view why) {
  return registryError(RegistryErrorCode::Refused,
                       "cannot register " + path + ": " + std::string(why));
}

std::optional<std::string> stringOf(const Dictionary& dictionary, std::string_view key) {
  const std::string* text = dictionary.get(key).string();
  if (text == nullptr || text->empty()) return std::nullopt;
  return *text;
}

// mkdir that accepts an existing directory (but not an existing file).
Status makeDirectory(const std::string& path, mode_t mode) {
  if (::mkdir(path.c_str(), mode) == 0) return okStatus();
  const int err = errno;
  struct stat status {};
  if (err == EEXIST && ::stat(path.c_str(), &status) == 0 && S_ISDIR(status.st_mode)) {
    return okStatus();
  }
  return Error::posix(err == EEXIST ? ENOTDIR : err, "mkdir " + path);
}

}  // namespace

std::optional<std::string> canonicalBundlePath(std::string_view path) {
  std::string trimmed(path);
  while (trimmed.size() > 1 && trimmed.back() == '/') trimmed.pop_back();
  if (trimmed.empty() || trimmed.front() != '/') return std::nullopt;
  if (std::optional<std::string> resolved = realPath(trimmed)) return resolved;
  const std::size_t slash = trimmed.rfind('/');
  const std::string parent = slash == 0 ? "/" : trimmed.substr(0, slash);
  const std::string name = trimmed.substr(slash + 1);
  std::optional<std::string> resolvedParent = realPath(parent);
  if (!resolvedParent || name.empty() || name == "." || name == "..") return std::nullopt;
  return (*resolvedParent == "/" ? "" : *resolvedParent) + "/" + name;
}

std::string fileUrl(std::string_view path) {
  static constexpr char kHex[] = "0123456789ABCDEF";
  std::string url = "file://";
  for (const char c : path) {
    const auto byte = static_cast<unsigned char>(c);
    const bool plain = (byte >= 'a' && byte <= 'z') || (byte >= 'A' && byte <= 'Z') ||
                       (byte >= '0' && byte <= '9') ||
                       std::string_view("/-._~!$&'()*+,;=:@").find(c) != std::string_view::npos;
    if (plain) {
      url += c;
    } else {
      url += '%';
      url += kHex[byte >> 4];
      url += kHex[byte & 0xf];
    }
  }
  return url;
}

RecordBuilder::RecordBuilder(RegistryLocations locations, const SdkRegistry& sdks,
                             const codesign::EntitlementStore& entitlements)
    : locations_(std::move(locations)), sdks_(sdks), entitlements_(entitlements) {}

Dictionary RecordBuilder::mergedInfo(const Dictionary& info, const std::string& path) const {
  const Dictionary* extension = info.get(kExtensionKey).dictionary();
  const std::optional<std::string> point = stringOf(*extension, kExtensionPointIdentifierKey);
  Dictionary merged = info;
  if (point) {
    Result<std::optional<Dictionary>> sdk = sdks_.sdkDictionary(*point);
    if (!sdk.ok()) {
      // An unreadable SDK is not the same as none: say so, then store the
      // plug-in as it declares itself.
      holvaneLog().error("%{public}@: cannot read SDK of \"%{public}@\": %{public}@", path, *point,
                         sdk.error());
    } else if (*sdk) {
      merged = mergeDictionaryInto(**sdk, info);
    }
  }
  merged.set(kBundleInfoVmapUrlKey, fileUrl(path + "/Info.vmap"));
  // Hosts select an extension point with {"XOExtensionPointName": id}, so
  // every record must carry a name unless the plug-in or SDK chose one.
  const Dictionary* mergedExtension = merged.get(kExtensionKey).dictionary();
  Dictionary plugIn = mergedExtension ? *mergedExtension : Dictionary();
  const Dictionary* currentAttributes = plugIn.get(kExtensionAttributesKey).dictionary();
  if (currentAttributes == nullptr && !plugIn.get(kExtensionAttributesKey).isNone()) {
    return merged;  // attributes of another kind: the plug-in's business
  }
  Dictionary attributes = currentAttributes ? *currentAttributes : Dictionary();
  if (attributes.get(kExtensionPointNameKey).isNone() && point) {
    attributes.set(kExtensionPointNameKey, *point);
    plugIn.set(kExtensionAttributesKey, std::move(attributes));
    merged.set(kExtensionKey, std::move(plugIn));
  }
  return merged;
}

Result<BuiltRecords> RecordBuilder::build(std::string_view bundlePath) const {
  const std::string given(bundlePath);
  std::optional<std::string> canonical = canonicalBundlePath(bundlePath);
  if (!canonical) return refused(given, "not an absolute path");
  Result<bundle::Bundle> made =
      bundle::Bundle::create(*canonical, bundle::BundlePathKind::Directory);
  if (!made.ok()) return refused(given, made.error().description());
  const bundle::Bundle& plugInBundle = *made;
  if (plugInBundle.bundleDirectory() != *canonical) return refused(given, "no bundle there");
  const Dictionary* info = plugInBundle.infoDictionary();
  if (info == nullptr) {
    const std::string why = plugInBundle.infoError() ? plugInBundle.infoError()->description()
                                                     : std::string("no Info.vmap");
    return refused(given, "unreadable Info.vmap: " + why);
  }
  const Dictionary* extension = info->get(kExtensionKey).dictionary();
  if (extension == nullptr) return refused(given, "Info.vmap has no XOExtension dictionary");

  BuiltRecords built;
  PlugInRecord& record = built.plugIn;
  record.path = *canonical;
  record.bundleIdentifier = stringOf(*info, kBundleIdentifierKey);
  std::optional<std::string> identifier = stringOf(*extension, kExtensionIdentifierKey);
  if (!identifier) identifier = record.bundleIdentifier;
  if (!identifier) {
    return refused(given, "no identifier (neither XOExtensionIdentifier nor BXBundleIdentifier)");
  }
  record.identifier = *identifier;
  record.version = stringOf(*info, kBundleVersionKey);
  if (!record.version) record.version = stringOf(*info, kBundleShortVersionKey);
  record.volume =
      record.path.starts_with(locations_.systemVolumePrefix()) ? Volume::System : Volume::Other;
  if (std::optional<bundle::Bundle> app = plugInBundle.containingApplication()) {
    ApplicationRecord application;
    application.path = app->bundleDirectory().value_or("");
    if (app->infoDictionary() != nullptr) {
      application.info = *app->infoDictionary();
      application.bundleIdentifier = stringOf(application.info, kBundleIdentifierKey);
    }
    application.executablePath = app->executablePath();
    application.registered = Date::now();
    record.containingApplicationPath = application.path;
    built.application = std::move(application);
  } else if (record.volume != Volume::System) {
    return refused(given, "plug-ins outside an application must be on the system volume");
  }

  record.info = mergedInfo(*info, record.path);
  const Dictionary* plugIn = record.plugInDictionary();
  const Dictionary* attributes =
      plugIn ? plugIn->get(kExtensionAttributesKey).dictionary() : nullptr;
  if (attributes != nullptr)
    record.extensionPointName = stringOf(*attributes, kExtensionPointNameKey);
  const bool isData =
      plugIn != nullptr && plugIn->get(kExtensionProtocolKey) == Value(kDataProtocol);
  if (!isData) {
    if (!record.bundleIdentifier)
      return refused(given, "no BXBundleIdentifier for its data container");
    Result<std::string> container = makeDataContainer(*record.bundleIdentifier);
    if (!container.ok()) return refused(given, container.error().description());
    record.dataContainer = std::move(container).value();
  }
  Result<Dictionary> entitlements = entitlements_.entitlementsOfBundle(record.path);
  if (entitlements.ok()) {
    record.entitlements = std::move(entitlements).value();
  } else {
    holvaneLog().error("%{public}@: cannot read entitlements: %{public}@", record.path,
                       entitlements.error());
  }
  record.registered = Date::now();
  return built;
}

Result<std::string> RecordBuilder::makeDataContainer(std::string_view bundleIdentifier) const {
  // The identifier names a directory, so it must be one plain path
  // component that keeps the container inside the containers directory.
  const std::string_view id = bundleIdentifier;
  const char* invalid = nullptr;
  if (id.empty() || id.size() > kMaxContainerNameBytes) {
    invalid = "empty or too long";
  } else if (id.find('/') != std::string_view::npos || id.find('\0') != std::string_view::npos) {
    invalid = "contains '/' or NUL";
  } else if (id.front() == '.') {
    invalid = "starts with '.'";
  }
  if (invalid != nullptr) {
    return registryError(RegistryErrorCode::Refused,
                         "bundle identifier cannot name a data container: " + std::string(invalid));
  }
  const std::string container = locations_.dataContainers() + "/" + std::string(bundleIdentifier);
  Status made = makeDirectory(container, 0700);
  if (!made.ok() && made.error().code() == ENOENT) {
    // Only the first container finds its parents missing: creating them for
    // every bundle would double the system calls of a first start.
    std::string path;
    for (std::string_view part : {"var", "containers", "Data"}) {
      path += "/";
      path += part;
      if (Status parent = makeDirectory(locations_.root + path, 0755); !parent.ok()) {
        return parent.error();
      }
    }
    made = makeDirectory(container, 0700);
  }
  if (!made.ok()) return made.error();
  if (Status tmp = makeDirectory(container + "/tmp", 0700); !tmp.ok()) return tmp.error();
  return container;
}

}  // namespace platform::holvane::internal
