// The database's read operations over the registration service: the
// filtered query with the user's elections, and look-ups by UUID, by
// bundle location and by containing application.
#include <locale.h>
#include <wctype.h>

#include <algorithm>
#include <cmath>
#include <limits>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "platform/values/Array.h"
#include "qvd/QVDAnnotationConstants.h"
#include "qvd/QVDatabase.h"

namespace qvd {

namespace {

using platform::Value;
using platform::holvane::PlugInRecord;

// The first code point of `s` (UTF-8), or none when it does not start with
// a well-formed sequence.
std::optional<char32_t> firstCodePoint(std::string_view s) {
  if (s.empty()) return std::nullopt;
  const auto b0 = static_cast<unsigned char>(s[0]);
  if (b0 < 0x80) return b0;
  int length = 0;
  char32_t cp = 0;
  if ((b0 & 0xE0) == 0xC0) {
    length = 2;
    cp = b0 & 0x1F;
  } else if ((b0 & 0xF0) == 0xE0) {
    length = 3;
    cp = b0 & 0x0F;
  } else if ((b0 & 0xF8) == 0xF0) {
    length = 4;
    cp = b0 & 0x07;
  } else {
    return std::nullopt;
  }
  if (s.size() < static_cast<std::size_t>(length)) return std::nullopt;
  for (int i = 1; i < length; ++i) {
    const auto b = static_cast<unsigned char>(s[i]);
    if ((b & 0xC0) != 0x80) return std::nullopt;
    cp = (cp << 6) | (b & 0x3F);
  }
  // Overlong forms, surrogates and values past the Unicode range.
  static constexpr char32_t kMinimum[] = {0, 0, 0x80, 0x800, 0x10000};
  if (cp < kMinimum[length] || cp > 0x10FFFF || (cp >= 0xD800 && cp <= 0xDFFF)) {
    return std::nullopt;
  }
  return cp;
}

// Combining marks, which the C library's classes leave out.
bool isCombiningMark(char32_t cp) {
  return (cp >= 0x0300 && cp <= 0x036F) || (cp >= 0x1AB0 && cp <= 0x1AFF) ||
         (cp >= 0x1DC0 && cp <= 0x1DFF) || (cp >= 0x20D0 && cp <= 0x20FF) ||
         (cp >= 0xFE20 && cp <= 0xFE2F);
}

// Letters and numbers of every script, by the UTF-8 C locale's character
// classes, held in a locale object of its own so that the process's locale
// is never touched. Without that locale only ASCII is recognised.
bool isLetterOrNumber(char32_t cp) {
  if (cp < 0x80) {
    return (cp >= '0' && cp <= '9') || (cp >= 'a' && cp <= 'z') || (cp >= 'A' && cp <= 'Z');
  }
  static const locale_t utf8 = ::newlocale(LC_CTYPE_MASK, "C.UTF-8", static_cast<locale_t>(0));
  if (utf8 == static_cast<locale_t>(0)) return false;
  return ::iswalnum_l(static_cast<wint_t>(cp), utf8) != 0;
}

// Whether the query's extension-point rule can only match records of one
// extension point, named exactly: then the registry may narrow by its index.
// Rules with an operator other than equality, lists, and names with digits
// (which the rule compares by numeric value, so "a01" matches "a1") are not
// narrowed; the daemon re-checks every rule on the candidates anyway.
std::optional<std::string> exactExtensionPoint(const platform::Dictionary& query) {
  const std::string* rule = query.get(platform::holvane::kExtensionPointNameKey).string();
  if (!rule) return std::nullopt;
  std::string_view name = *rule;
  if (name.starts_with('=')) {
    name.remove_prefix(1);
  } else if (name.starts_with('?') || name.starts_with('<') || name.starts_with('>')) {
    return std::nullopt;
  }
  if (name.empty()) return std::nullopt;
  if (std::any_of(name.begin(), name.end(), [](char c) { return c >= '0' && c <= '9'; })) {
    return std::nullopt;
  }
  return std::string(name);
}

// The record paths, for the debug lines.
platform::Array pathsOf(const std::vector<PlugInRecord>& records) {
  platform::Array paths;
  for (const PlugInRecord& record : records) paths.append(Value(record.path));
  return paths;
}

// The path of a file URL, or none (logged).
std::optional<std::string> pathOfURL(std::string_view url) {
  std::optional<std::string> path = QVPathFromFileURL(url);
  if (!path) QVLogOps().info("not a file URL: %{public}s", std::string(url));
  return path;
}

}  // namespace

std::optional<std::string> normalizedElection(const Value& element) {
  const std::string* text = element.string();
  if (!text || text->empty()) return std::nullopt;
  if ((*text)[0] == '=') return text->substr(1);
  const std::optional<char32_t> first = firstCodePoint(*text);
  if (first && (isLetterOrNumber(*first) || isCombiningMark(*first))) return *text;
  return std::nullopt;
}

std::optional<std::vector<std::string>> electionListFromQuery(const platform::Dictionary& query) {
  const Value& value = query.get(QVUserElectionAttribute);
  if (const platform::Array* list = value.array()) {
    std::vector<std::string> elections;
    for (const Value& element : *list) {
      std::optional<std::string> normalized = normalizedElection(element);
      // One bad element switches filtering off for the whole query.
      if (!normalized) return std::nullopt;
      elections.push_back(std::move(*normalized));
    }
    return elections;
  }
  if (value.string()) {
    std::optional<std::string> normalized = normalizedElection(value);
    if (!normalized) return std::nullopt;
    return std::vector<std::string>{std::move(*normalized)};
  }
  return std::nullopt;
}

std::int64_t electionInteger(const Value& election) {
  if (std::optional<std::int64_t> i = election.int64()) return *i;
  // Past the signed range only the low bits matter to the key.
  if (std::optional<std::uint64_t> u = election.uint64()) return static_cast<std::int64_t>(*u);
  if (std::optional<double> r = election.real()) {
    const double truncated = std::trunc(*r);
    constexpr double kLimit = 9.2e18;                              // inside the int64 range
    if (!(truncated >= -kLimit && truncated <= kLimit)) return 0;  // NaN or out of range
    return static_cast<std::int64_t>(truncated);
  }
  return 0;
}

std::string electionKey(const Value& election) {
  const auto low = static_cast<std::uint8_t>(static_cast<std::uint64_t>(electionInteger(election)));
  return std::to_string(static_cast<unsigned>(low));
}

std::optional<QVDPlugInSet> QVDatabase::findPlugIns(
    const std::optional<platform::Dictionary>& query, QVDLentRecords* lent) {
  if (!registry_) return std::nullopt;
  // Read before the query: its records are at least this current.
  const platform::Uuid generation = registry_->generation();
  platform::Result<std::vector<PlugInRecord>> records = std::vector<PlugInRecord>();
  if (!query || query->empty()) {
    records = registry_->allPlugIns();
    if (records.ok() && QVLogHV().isEnabled(platform::log::Level::Debug)) {
      QVLogHV().debug("%d installedPlugins: %@", records->size(), Value(pathsOf(*records)));
    }
  } else {
    const std::optional<std::vector<std::string>> elections = electionListFromQuery(*query);
    const QVDAnnotationStore* store = annotations_.get();
    // Runs wherever the registry calls it; it reads the annotation store
    // only, never the cache, so it needs no hop to the database queue.
    auto filter = [&elections, store](const PlugInRecord& record) {
      std::string identity = record.identifier;
      const platform::Dictionary* entitlements =
          record.entitlements ? &*record.entitlements : nullptr;
      // A replacement is judged by the elections of the plug-in it replaces.
      if (entitlements) {
        if (const std::string* replaced = entitlements->get(QVOverrideEntitlement).string()) {
          identity = *replaced;
        }
      }
      if (!elections) return platform::holvane::FilterVerdict::Keep;
      std::optional<platform::Dictionary> annotation =
          store ? store->annotationForIdentifier(identity) : std::nullopt;
      const Value election = annotation ? annotation->get(QVAnnotationElectionKey) : Value();
      std::string key;
      if (election.isNone()) {
        const Value autoElect = entitlements ? entitlements->get(QVAutoElectEntitlement) : Value();
        key = autoElect.isNumber() && autoElect.truth().value_or(false) ? "1" : "0";
      } else {
        key = electionKey(election);
      }
      const bool pass = std::find(elections->begin(), elections->end(), key) != elections->end();
      QVLogOps().debug("hv filter %@ -> %d", identity, pass ? 1 : 0);
      return pass ? platform::holvane::FilterVerdict::Keep : platform::holvane::FilterVerdict::Skip;
    };
    records = registry_->queryPlugIns(exactExtensionPoint(*query), filter);
    if (records.ok() && QVLogHV().isEnabled(platform::log::Level::Debug)) {
      QVLogHV().debug("%d plugin(s) matching %@ = %@", records->size(), Value(*query),
                      Value(pathsOf(*records)));
    }
  }
  if (!records.ok()) {
    QVLogHV().error("plug-in query failed: %{public}@", records.error());
    return std::nullopt;
  }

  const std::size_t before = cache_->approximateCount();
  QVDPlugInSet found;
  for (PlugInRecord& record : *records) {
    if (record.path.empty()) {
      QVLogOps().info("skipping hv proxy %@ with nil bundleURL", record.uuid);
      continue;
    }
    if (record.containingApplicationPath) {
      auto application = registry_->applicationByPath(*record.containingApplicationPath);
      if (!application.ok() || !*application) {
        // No application record where one is named: not a usable container.
        QVLogOps().info("HV reported containingBundle is not an application");
        continue;
      }
      if ((*application)->presence() == platform::holvane::ExecutablePresence::Placeholder) {
        QVLogOps().info("skipping hv proxy %@ because its app is a placeholder", record.path);
        continue;
      }
    }
    auto shared = std::make_shared<const PlugInRecord>(std::move(record));
    std::shared_ptr<QVDPlugIn> plugIn = plugInForProxy(*shared);
    if (!plugIn) continue;
    if (lent != nullptr) {
      plugIn->lendRecord(generation, shared);
      lent->push_back(std::move(shared));
    }
    found.insert(std::move(plugIn));
  }
  QVLogOps().debug("HV reported %u plug-ins (cache %u/%u)", found.size(), before,
                   cache_->approximateCount());
  return found;
}

std::shared_ptr<QVDPlugIn> QVDatabase::findPlugIn(const platform::Uuid& uuid) {
  if (!registry_) return nullptr;
  std::shared_ptr<QVDPlugIn> found;
  sync_->sync([&] {
    found = cachedOnQueue(uuid);
    if (found) return;
    auto record = registry_->plugInByUuid(uuid);
    if (!record.ok()) {
      QVLogHV().error("registration lookup by uuid failed: %{public}@", record.error());
    } else if (*record) {
      found = createPlugInForProxy(**record);
      return;
    }
    QVLogOps().info("Holvane cannot find plug-in with UUID:%{public}@", uuid.toString());
  });
  return found;
}

std::shared_ptr<QVDPlugIn> QVDatabase::findPlugInAtPath(std::string_view url) {
  if (!registry_) return nullptr;
  const std::optional<std::string> path = pathOfURL(url);
  if (!path) return nullptr;
  auto record = registry_->plugInByPath(*path);
  if (!record.ok()) {
    QVLogHV().error("registration lookup by path failed: %{public}@", record.error());
  } else if (*record) {
    return findPlugIn((*record)->uuid);
  }
  QVLogOps().info("Holvane cannot find plug-in at path:%@", *path);
  return nullptr;
}

std::optional<std::vector<std::shared_ptr<QVDPlugIn>>> QVDatabase::plugInsWithinApplication(
    std::string_view url) {
  if (!registry_) return std::nullopt;
  const std::optional<std::string> path = pathOfURL(url);
  if (!path) return std::nullopt;
  auto application = registry_->applicationByPath(*path);
  if (!application.ok()) {
    QVLogHV().error("application lookup failed: %{public}@", application.error());
    return std::nullopt;
  }
  if (!*application) return std::nullopt;
  auto records = registry_->plugInsOfApplication((*application)->path);
  if (!records.ok()) {
    QVLogHV().error("application plug-in lookup failed: %{public}@", records.error());
    return std::nullopt;
  }
  if (records->empty()) return std::nullopt;
  std::vector<std::shared_ptr<QVDPlugIn>> plugIns;
  for (const PlugInRecord& record : *records) {
    if (std::shared_ptr<QVDPlugIn> plugIn = plugInForProxy(record)) plugIns.push_back(plugIn);
  }
  return plugIns;
}

}  // namespace qvd
