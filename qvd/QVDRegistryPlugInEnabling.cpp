// Enabling: telling the service manager that a host may run this plug-in as
// a service, in which sandbox profile and with which environment. Nothing is
// cached or undone here: every "ready" computes it all afresh, and ending a
// pairing is the service manager's removal.
#include <cstdlib>
#include <string>
#include <string_view>

#include "Quorvex/QVBundle.h"
#include "Quorvex/QVErrors.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "platform/bundle/Bundle.h"
#include "qvd/QVDMbxClient.h"
#include "qvd/QVDRegistryPlugIn.h"

namespace qvd {

namespace {

constexpr std::string_view kServiceKey = "MBXService";
constexpr std::string_view kEnvironmentKey = "EnvironmentVariables";
constexpr std::string_view kPointKey = "XOExtensionPointIdentifier";
constexpr std::string_view kKeyboardPoint = "com.corvane.keyboard-service";

// Extension points with a profile of their own, read from the normalised
// plug-in dictionary. The keyboard and the network filter are decided on the
// raw manifest before this table is consulted.
struct ProfileRow {
  std::string_view point;
  std::string_view profile;
};
constexpr ProfileRow kProfiles[] = {
    {"com.corvane.glimpsa.extension.preview", "glimpsad"},
    {"com.corvane.glimpsa.preview", "glimpsa-preview"},
    {"com.corvane.glimpsa.preview.highmemory", "glimpsa-preview"},
    {"com.corvane.glimpsa.thumbnail", "glimpsa-thumbnail"},
    {"com.corvane.glimpsa.thumbnail.highmemory", "glimpsa-thumbnail"},
    {"com.corvane.app.non-ui-extension", "sandlot-devtools"},
    {"com.corvane.app.non-ui-extension.multiple-instances", "sandlot-devtools"},
    {"com.corvane.callerscope.message-filter", "message-filter"},
    {"com.corvane.callerscope.classification-ui", "classification-ui"},
};

std::string uuidString(const QVDPlugIn& plugIn) {
  const std::optional<platform::Uuid> uuid = plugIn.uuid();
  return uuid ? uuid->toString() : std::string();
}

std::string versionString(const QVDPlugIn& plugIn) {
  const platform::Value version = plugIn.version();
  if (const std::string* text = version.string()) return *text;
  return version.isNone() ? std::string() : version.description();
}

}  // namespace

std::string QVDPlugIn::sandboxProfile() const {
  const platform::Value rawPoint = pluginKey(kPointKey);
  const std::string* raw = rawPoint.string();
  if (raw != nullptr && *raw == kKeyboardPoint) {
    // A keyboard that asks for open access gets the ordinary plug-in
    // profile, with its network, only once the user has consented for the
    // application that ships it.
    const bool openAccess = attribute("RequestsOpenAccess").boolean().value_or(false);
    if (openAccess &&
        allowedPVGServices().contains(std::string(platform::pvg::kPVGServiceKeyboardNetwork))) {
      return "plugin";
    }
    return "keyboard";
  }
  if (raw != nullptr && *raw == "com.corvane.netwarden.filter-data") return "network-filter";
  const DictionaryRef normalised = plugInDictionary();
  const std::string* point = normalised ? normalised->get(kPointKey).string() : nullptr;
  if (point != nullptr) {
    for (const ProfileRow& row : kProfiles) {
      if (*point == row.point) return std::string(row.profile);
    }
  }
  return "plugin";
}

std::set<std::string> QVDPlugIn::allowedPVGServices() const {
  std::set<std::string> granted;
  const std::optional<std::string> containing = containingUrl();
  if (!containing) return granted;
  const std::optional<std::string> applicationPath = QVPathFromFileURL(*containing);
  // A Bundle reads its manifest when made, so a new one is as fresh as a
  // flushed cache.
  platform::Result<platform::bundle::Bundle> application =
      applicationPath ? platform::bundle::Bundle::create(
                            *applicationPath, platform::bundle::BundlePathKind::Directory)
                      : platform::Result<platform::bundle::Bundle>(
                            platform::Error::posix(EINVAL, "not a file URL"));
  if (!application.ok() || !application->bundleDirectory()) {
    QVLogOps().info("failed to create bundle for %@", path().value_or(""));
    return granted;
  }
  if (!services_.consents) {
    QVLogOps().info("PVGAccessCopyInformationForBundle failed for %@",
                    *application->bundleDirectory());
    return granted;
  }
  platform::Result<std::vector<platform::pvg::ConsentRecord>> records =
      services_.consents->consentRecordsForBundle(*application);
  if (!records.ok()) {
    QVLogOps().info("PVGAccessCopyInformationForBundle failed for %@",
                    *application->bundleDirectory());
    return granted;
  }
  for (const platform::pvg::ConsentRecord& record : *records) {
    if (record.granted.value_or(false)) granted.insert(record.service);
  }
  return granted;
}

std::optional<platform::Error> QVDPlugIn::enableForClient(
    const QVDMbxClient& client, const std::optional<platform::Dictionary>& environment) const {
  const std::string identifier = this->identifier().value_or("");
  const std::string version = versionString(*this);
  const std::string uuid = uuidString(*this);
  const std::string bundlePath = path().value_or("");

  platform::Dictionary merged = environment.value_or(platform::Dictionary());
  const std::optional<std::string> container =
      dataContainerURL() ? QVPathFromFileURL(*dataContainerURL()) : std::nullopt;
  if (container) {
    merged.set("HOME", *container);
    merged.set("BXFIXED_USER_HOME", *container);
    merged.set("TMPDIR", (container->ends_with('/') ? *container : *container + "/") + "tmp");
  } else {
    QVLogOps().debug("no data container for plug-in %@(%@) %{public}@ at %@", identifier, version,
                     uuid, bundlePath);
  }
  const std::string profile = sandboxProfile();
  if (const char* sdk = std::getenv("QVTEST_SDK")) merged.set("QVTEST_SDK", std::string(sdk));

  const platform::Value declared = infoKey(kServiceKey);
  platform::Dictionary service;
  if (const platform::Dictionary* own = declared.dictionary()) {
    QVLogHV().debug("raw MBXService=%@", declared);
    service = *own;
  } else {
    QVLogOps().info("no MBXService for plug-in; database returned %@", declared);
  }
  // The plug-in's own variables win over the host's and the container's.
  if (const platform::Dictionary* own = service.get(kEnvironmentKey).dictionary()) {
    for (const auto& [name, value] : *own) merged.set(name, value);
  }
  service.set(kEnvironmentKey, std::move(merged));
  service.set("_SandboxProfile", profile);
  service.set("_OmitSandboxParameters", true);
  QVLogOps().info("assigning plug-in %@(%@) %{public}@ to %s sandbox", identifier, version, uuid,
                  profile);

  const platform::Dictionary overlay{{std::string(kServiceKey), std::move(service)},
                                     {"BXBundlePackageType", "MBX!"}};
  QVLogOps().notice("allowing host %d %@ to use plug-in %@(%@) uuid=%{public}@ at %@", client.pid(),
                    client.path(), identifier, version, uuid, bundlePath);

  const std::shared_ptr<QVBundle> bundle = url() ? QVBundle::initWithURL(*url()) : nullptr;
  const std::optional<std::string> executable = bundle ? bundle->executablePath() : std::nullopt;
  if (!executable) {
    QVLogOps().error("failed to obtain execPath for plug-in %@(%{public}@) bundle=%@", identifier,
                     uuid, bundle ? bundle->description() : bundlePath);
    return QVErrorWithCodeMessage(
        QVErrorInvalidRequest,
        "cannot obtain executable path for plug-in " + identifier + "(" + uuid + ")");
  }
  QVLogOps().debug("activation overlay=%@", platform::Value(overlay));
  const int result = services_.serviceManager ? services_.serviceManager->addExternalService(
                                                    client.pid(), *executable, overlay)
                                              : ENOSYS;
  if (result != 0) {
    QVLogOps().error(
        "lumend error %d trying to allow %d %@ to use plug-in %@(%@) uuid=%{public}@ at %@", result,
        client.pid(), client.path(), identifier, version, uuid, bundlePath);
    return QVErrorWithCodeMessage(QVErrorInvalidRequest,
                                  "unable to enable plug-in " + identifier + "(" + uuid + ")");
  }
  return std::nullopt;
}

}  // namespace qvd
