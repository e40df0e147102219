#include "qvd/MatchResults.h"

#include <algorithm>
#include <utility>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/QVVersionComparison.h"
#include "qvd/Transaction.h"

namespace qvd {

namespace {

std::string_view textOf(const platform::Dictionary& form, std::string_view key) {
  const std::string* text = form.get(key).string();
  return text ? std::string_view(*text) : std::string_view();
}

}  // namespace

std::string versionText(const QVDPlugIn& plugIn) {
  const platform::Value version = plugIn.version();
  if (const std::string* text = version.string()) return *text;
  return version.isNone() ? std::string(QVFormNoVersion) : version.description();
}

MatchResults::MatchResults(std::uint64_t flags, std::shared_ptr<const Transaction> transaction)
    : flags_(flags),
      transaction_(std::move(transaction)),
      queue_(platform::dispatch::SerialQueue::create(
          "com.corvane.qvd.postExporting", platform::dispatch::Priority::UserInitiated)) {}

bool MatchResults::preferred(const QVDPlugIn& plugIn, const platform::Dictionary& kept) {
  const bool keptOnSystem = kept.get(QVFormSystemResidentKey).boolean().value_or(false);
  if (!plugIn.onSystemVolume() && keptOnSystem) return false;
  if (plugIn.onSystemVolume() && !keptOnSystem) return true;
  // Equal times keep the form that was there first.
  const std::int64_t keptModified = kept.get(QVFormLastModifiedKey).int64().value_or(0);
  return static_cast<std::int64_t>(plugIn.lastModified()) > keptModified;
}

MatchResults::Verdict MatchResults::compare(const QVDPlugIn& plugIn,
                                            const platform::Dictionary& kept) const {
  const QVOrdering order =
      compareVersionString(versionText(plugIn), textOf(kept, QVFormVersionKey));
  const bool keepVersions = (flags_ & QVDiscoverKeepVersions) != 0;
  const bool keepDuplicates = keepVersions && (flags_ & QVDiscoverKeepDuplicates) != 0;
  if (order == QVOrdering::Same) {
    if (keepDuplicates) return Verdict::KeepBoth;
    return preferred(plugIn, kept) ? Verdict::ReplaceKept : Verdict::DropNew;
  }
  if (keepVersions) return Verdict::KeepBoth;
  return order == QVOrdering::Descending ? Verdict::ReplaceKept : Verdict::DropNew;
}

void MatchResults::merge(const QVDPlugIn& plugIn, platform::Dictionary form) {
  QV_ASSERT_ON_QUEUE(queue_);
  std::vector<Form>& same = kept_[plugIn.identifier().value_or("")];
  for (auto kept = same.begin(); kept != same.end(); ++kept) {
    const Verdict verdict = compare(plugIn, **kept);
    if (verdict == Verdict::KeepBoth) continue;
    if (verdict == Verdict::DropNew) return;
    encodings_.erase(kept->get());
    same.erase(kept);
    break;
  }
  auto merged = std::make_shared<platform::Dictionary>(std::move(form));
  transaction_->addAnnotationForPlugIn(plugIn, *merged);
  plugIn.augmentForm(*merged);
  same.push_back(merged);
  recordReplacements(plugIn, merged);
  encode(merged);
}

void MatchResults::encode(const Form& form) {
  platform::Result<platform::cbor::EncodedValue> encoded =
      platform::cbor::EncodedValue::encode(*form);
  if (!encoded.ok()) {
    encodings_.erase(form.get());
    QVLogOps().error("plug-in form %{public}@ cannot be sent: %{public}@", form->get(QVFormUUIDKey),
                     encoded.error());
    return;
  }
  encodings_.insert_or_assign(form.get(), std::move(encoded).value());
}

std::optional<std::vector<platform::cbor::EncodedValue>> MatchResults::encodedMatches() const {
  std::vector<platform::cbor::EncodedValue> list;
  list.reserve(matches_.size());
  for (const Form& form : matches_) {
    auto found = encodings_.find(form.get());
    if (found == encodings_.end()) return std::nullopt;
    list.push_back(found->second);
  }
  return list;
}

void MatchResults::recordReplacements(const QVDPlugIn& plugIn, const Form& form) {
  const platform::Value declared = plugIn.valueForEntitlement(QVOverrideEntitlement);
  if (const std::string* replaced = declared.string()) {
    overrides_[*replaced] = form;
  } else if (const platform::Array* list = declared.array()) {
    for (const platform::Value& entry : *list) {
      if (const std::string* replaced = entry.string()) overrides_[*replaced] = form;
    }
  }
}

void MatchResults::finish() {
  for (auto& [identifier, forms] : kept_) {
    for (Form& form : forms) matches_.push_back(std::move(form));
  }
  kept_.clear();
  if (!overrides_.empty()) {
    for (const Form& replaced : matches_) {
      auto found = overrides_.find(textOf(*replaced, QVFormIdentifierKey));
      if (found == overrides_.end()) continue;
      const Form& replacing = found->second;
      // Read before writing: a plug-in that names its own identifier is
      // both forms at once.
      const platform::Value replacingUuid = replacing->get(QVFormUUIDKey);
      const platform::Value replacedIdentifier = replaced->get(QVFormIdentifierKey);
      replaced->set(QVOverriderFormKey, replacingUuid);
      replacing->set(QVOverridingFormKey, replacedIdentifier);
      encode(replaced);
      encode(replacing);
      QVLogOps().info("plug-in %{public}@ overrides %{public}@", replacingUuid,
                      replaced->get(QVFormUUIDKey));
    }
  }
  // The keys are read once per form, not once per comparison: at 10,000
  // forms the lookups inside the comparisons cost more than the sort.
  struct SortKey {
    std::string_view identifier;
    std::string_view version;
    std::string_view path;
    std::size_t index;
  };
  std::vector<SortKey> keys;
  keys.reserve(matches_.size());
  for (std::size_t i = 0; i < matches_.size(); ++i) {
    const platform::Dictionary& form = *matches_[i];
    keys.push_back(SortKey{textOf(form, QVFormIdentifierKey), textOf(form, QVFormVersionKey),
                           textOf(form, QVFormPathKey), i});
  }
  std::stable_sort(keys.begin(), keys.end(), [](const SortKey& a, const SortKey& b) {
    if (a.identifier != b.identifier) return a.identifier < b.identifier;
    const QVOrdering order = compareVersionString(a.version, b.version);
    if (order != QVOrdering::Same) return order == QVOrdering::Ascending;
    return a.path < b.path;
  });
  std::vector<Form> sorted;
  sorted.reserve(matches_.size());
  for (const SortKey& key : keys) sorted.push_back(std::move(matches_[key.index]));
  matches_ = std::move(sorted);
}

}  // namespace qvd
