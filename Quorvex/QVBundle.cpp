#include "Quorvex/QVBundle.h"

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "platform/bundle/BundleError.h"

using platform::bundle::Bundle;
using platform::bundle::BundlePathKind;
using platform::bundle::BundleProperty;

std::shared_ptr<QVBundle> QVBundle::initWithMBXBundle(Bundle bundle) {
  return std::shared_ptr<QVBundle>(new QVBundle(std::move(bundle)));
}

std::shared_ptr<QVBundle> QVBundle::initForMainBundle() {
  return initWithExecutablePath("/proc/self/exe");
}

std::shared_ptr<QVBundle> QVBundle::initWithPath(std::string_view path) {
  auto bundle = Bundle::create(path, BundlePathKind::Directory);
  if (!bundle.ok()) return nullptr;
  return initWithMBXBundle(std::move(bundle).value());
}

std::shared_ptr<QVBundle> QVBundle::initWithURL(std::string_view fileURL) {
  auto path = QVPathFromFileURL(fileURL);
  return path ? initWithPath(*path) : nullptr;
}

std::shared_ptr<QVBundle> QVBundle::initWithExecutablePath(std::string_view path) {
  auto bundle = Bundle::create(path, BundlePathKind::Executable);
  if (!bundle.ok()) return nullptr;
  // No bundle around the executable: the path may name a bundle directory.
  if (bundle->property(BundleProperty::BundleDirectory).isNone()) {
    auto asDirectory = Bundle::create(path, BundlePathKind::Directory);
    if (asDirectory.ok()) return initWithMBXBundle(std::move(asDirectory).value());
  }
  return initWithMBXBundle(std::move(bundle).value());
}

std::shared_ptr<QVBundle> QVBundle::initWithExecutableURL(std::string_view fileURL) {
  auto path = QVPathFromFileURL(fileURL);
  return path ? initWithExecutablePath(*path) : nullptr;
}

std::optional<std::string> QVBundle::stringProperty(int number) const {
  platform::Value v = bundle_.property(number);
  if (const std::string* s = v.string()) return *s;
  return std::nullopt;
}

std::optional<std::string> QVBundle::path() const {
  return stringProperty(static_cast<int>(BundleProperty::BundleDirectory));
}

std::optional<std::string> QVBundle::url() const {
  auto p = path();
  if (!p) return std::nullopt;
  return QVFileURLFromPath(*p);
}

std::optional<std::string> QVBundle::executablePath() const {
  if (auto exe = stringProperty(static_cast<int>(BundleProperty::Executable))) return exe;
  return path();
}

std::optional<std::string> QVBundle::supportPath() const {
  std::call_once(supportPathOnce_, [this] {
    supportPath_ = stringProperty(static_cast<int>(BundleProperty::SupportFilesDirectory));
  });
  return supportPath_;
}

std::optional<std::string> QVBundle::bundleDirectory(std::string_view name) const {
  auto support = supportPath();
  if (!support) return std::nullopt;
  std::string out = *support;
  if (out.empty() || out.back() != '/') out.push_back('/');
  out.append(name);
  return out;
}

std::optional<platform::Dictionary> QVBundle::infoDictionary() const {
  if (const platform::Dictionary* info = bundle_.infoDictionary()) return *info;
  std::string where = path().value_or("(no bundle directory)");
  const auto& error = bundle_.infoError();
  if (error &&
      platform::bundle::isBundleError(*error, platform::bundle::BundleErrorCode::InfoNotADictionary)) {
    // Read, but not a dictionary: the conversion is what failed.
    QVLogOps().info("failed to convert Info.vmap to dictionary: %@ source=%@", where, *error);
  } else {
    QVLogOps().info("failed to retrieve Info.vmap for %@ through %@", where, description());
  }
  return std::nullopt;
}

std::optional<std::string> QVBundle::bundleIdentifier() const {
  const platform::Dictionary* info = bundle_.infoDictionary();
  if (!info) return std::nullopt;
  if (const std::string* id = info->get("BXBundleIdentifier").string()) return *id;
  return std::nullopt;
}

std::string QVBundle::description() const {
  return "<QVBundle path=" + path().value_or("(none)") +
         " executable=" + stringProperty(static_cast<int>(BundleProperty::Executable)).value_or("(none)") +
         ">";
}
