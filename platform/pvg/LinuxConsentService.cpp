#include "platform/pvg/LinuxConsentService.h"

#include <errno.h>

#include <utility>

#include "platform/log/LoggerRegistry.h"
#include "platform/root/Root.h"
#include "platform/vmap/Reader.h"

namespace platform::pvg {

namespace {

const log::Logger& pvgLog() {
  static const log::Logger& logger = log::platformLog("pvg");
  return logger;
}

Error consentError(ConsentErrorCode code, std::string description) {
  return Error(std::string(kConsentErrorDomain), static_cast<std::int64_t>(code),
               std::move(description));
}

// A record is a flat dictionary; a little nesting is tolerated so that an
// installer may add fields later. Items bound the memory a small file full
// of one-byte binary items could otherwise claim.
constexpr std::size_t kMaxDepth = 8;
constexpr std::size_t kMaxItems = 1u << 18;

constexpr std::string_view kServiceKey = "service";
constexpr std::string_view kGrantedKey = "granted";

}  // namespace

std::optional<std::string> consentBundleIdentifier(const platform::bundle::Bundle& bundle) {
  const Dictionary* info = bundle.infoDictionary();
  if (info == nullptr) return std::nullopt;
  const std::string* identifier = info->get(kBundleIdentifierKey).string();
  if (identifier == nullptr) return std::nullopt;
  return *identifier;
}

bool isConsentBundleIdentifier(std::string_view identifier) {
  return !identifier.empty() && identifier.size() <= 250 && identifier != "." &&
         identifier != ".." && identifier.find('/') == std::string_view::npos &&
         identifier.find('\0') == std::string_view::npos;
}

LinuxConsentService::LinuxConsentService() : LinuxConsentService(rootPath("var/db/pvg")) {}

LinuxConsentService::LinuxConsentService(std::string directory, ConsentLimits limits)
    : directory_(std::move(directory)), limits_(limits) {}

Result<std::vector<ConsentRecord>> LinuxConsentService::consentRecordsForBundle(
    const platform::bundle::Bundle& bundle) const {
  const std::optional<std::string> identifier = consentBundleIdentifier(bundle);
  if (!identifier) {
    return consentError(ConsentErrorCode::NoBundleIdentifier,
                        "bundle " + bundle.bundleDirectory().value_or("(none)") +
                            " has no bundle identifier");
  }
  if (!isConsentBundleIdentifier(*identifier)) {
    return consentError(ConsentErrorCode::InvalidBundleIdentifier,
                        "bundle identifier cannot name a consent file");
  }
  const std::string path = directory_ + "/" + *identifier + ".vmap";
  const vmap::ReadLimits readLimits{
      .maxBytes = limits_.maxFileBytes, .maxDepth = kMaxDepth, .maxItems = kMaxItems};
  Result<Value> document = vmap::readFile(path, readLimits);
  if (!document.ok()) {
    // No file: nothing was ever recorded for this application.
    if (document.error().is(kPosixErrorDomain, ENOENT)) return std::vector<ConsentRecord>();
    return document.error();
  }
  const Array* elements = document->array();
  if (elements == nullptr) {
    return consentError(ConsentErrorCode::NotAnArray,
                        path + ": the consents are a " + valueTypeName(document->type()) +
                            ", not an array");
  }

  std::vector<ConsentRecord> records;
  std::size_t index = 0;
  for (const Value& element : *elements) {
    if (records.size() == limits_.maxRecords) {
      pvgLog().error("more than %zu consent records in %{public}s; the rest are ignored",
                     limits_.maxRecords, path);
      break;
    }
    const std::size_t position = index++;
    const Dictionary* fields = element.dictionary();
    if (fields == nullptr) {
      pvgLog().error("consent %zu in %{public}s is not a dictionary; skipped", position, path);
      continue;
    }
    const std::string* service = fields->get(kServiceKey).string();
    if (service == nullptr) {
      pvgLog().error("consent %zu in %{public}s has no service string; skipped", position, path);
      continue;
    }
    records.push_back(ConsentRecord{*service, fields->get(kGrantedKey).boolean()});
  }
  return records;
}

}  // namespace platform::pvg
