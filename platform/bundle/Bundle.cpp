#include "platform/bundle/Bundle.h"

#include <limits.h>

#include "platform/bundle/BundleError.h"
#include "platform/bundle/internal/BundlePaths.h"
#include "platform/vmap/Reader.h"

namespace platform::bundle {

Result<Bundle> Bundle::create(std::string_view path, BundlePathKind kind) {
  if (path.empty() || path.front() != '/' || path.size() >= PATH_MAX ||
      path.find('\0') != std::string_view::npos) {
    return bundleError(BundleErrorCode::InvalidPath,
                       "not an absolute path: \"" + std::string(path.substr(0, 256)) + "\"");
  }
  const std::string given(path);
  Bundle bundle;
  if (kind == BundlePathKind::Directory) {
    // A directory without a manifest is still the bundle asked for; only its
    // info is then missing.
    std::optional<std::string> resolved = internal::resolvedPath(given);
    if (resolved.has_value() && internal::isDirectory(*resolved)) {
      bundle.directory_ = std::move(resolved);
    }
  } else if (std::optional<std::string> start = internal::executableDirectory(given)) {
    bundle.directory_ = internal::findBundleDirectory(*start);
  }
  bundle.readInfo();
  if (bundle.directory_.has_value()) {
    if (const Dictionary* info = bundle.infoDictionary()) {
      if (const std::string* name = info->get("BXExecutable").string()) {
        bundle.executable_ = internal::executableInBundle(*bundle.directory_, *name);
      }
    }
  }
  return bundle;
}

void Bundle::readInfo() {
  if (!directory_.has_value()) {
    infoError_ = bundleError(BundleErrorCode::NoBundleDirectory, "no bundle directory");
    return;
  }
  const std::string manifest =
      *directory_ == "/" ? std::string("/Info.vmap") : *directory_ + "/Info.vmap";
  vmap::ReadLimits limits;
  limits.maxBytes = kMaxInfoBytes;
  limits.maxDepth = kMaxInfoDepth;
  limits.maxItems = kMaxInfoItems;
  Result<Value> read = vmap::readFile(manifest, limits);
  if (!read.ok()) {
    infoError_ = read.error();
  } else if (read->dictionary() == nullptr) {
    infoError_ = bundleError(BundleErrorCode::InfoNotADictionary,
                             manifest + ": the top level is not a dictionary");
  } else {
    info_ = std::move(read).value();
  }
}

Value Bundle::property(int number) const {
  const std::optional<std::string>* path = nullptr;
  switch (static_cast<BundleProperty>(number)) {
    case BundleProperty::BundleDirectory:
      path = &directory_;
      break;
    case BundleProperty::Executable:
      path = &executable_;
      break;
    case BundleProperty::SupportFilesDirectory:
      path = &directory_;
      break;
  }
  if (path == nullptr || !path->has_value()) return Value();
  return Value(**path);
}

bool Bundle::isApplication() const {
  return directory_.has_value() && internal::nameEndsWith(*directory_, ".app");
}

bool Bundle::isPlugIn() const {
  const Dictionary* info = infoDictionary();
  if (info == nullptr) return false;
  return info->get("XOExtension").dictionary() != nullptr || info->contains("Quorvex");
}

bool Bundle::isApplicationExtension() const {
  return isPlugIn() && internal::nameEndsWith(*directory_, ".ovx");
}

std::optional<Bundle> Bundle::containingApplication() const {
  if (!directory_.has_value()) return std::nullopt;
  for (std::string ancestor = internal::parentOf(*directory_); ancestor != "/";
       ancestor = internal::parentOf(ancestor)) {
    if (!internal::nameEndsWith(ancestor, ".app")) continue;
    const std::string plugIns = ancestor + "/PlugIns/";
    if (directory_->compare(0, plugIns.size(), plugIns) != 0) continue;
    Result<Bundle> application = create(ancestor, BundlePathKind::Directory);
    if (application.ok()) return std::move(application).value();
  }
  return std::nullopt;
}

}  // namespace platform::bundle
