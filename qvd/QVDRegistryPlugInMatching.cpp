// Match rules: how a host's query, a host's restriction entitlement and the
// global exclusions select plug-ins. Every piece of a rule set comes from a
// client or a settings file, so nothing here fails or throws: whatever is
// malformed simply does not match.
#include <array>
#include <cstdint>
#include <string>
#include <string_view>

#include "Quorvex/QVDConstants.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVVersionComparison.h"
#include "qvd/QVDRegistryPlugIn.h"
#include "qvd/QVDServer.h"

namespace qvd {

namespace {

using platform::Value;

constexpr std::string_view kEntitlementKeyPrefix = "ENTITLEMENT:";
constexpr std::string_view kConformsOperator = "?KT-CONFORMS:";
constexpr std::string_view kIsOperator = "?KT-IS:";

// The comparison operators, in the order they are tried: two-character
// operators first, so "<>x" is inequality with "x", not "less than >x".
enum class Comparison { NotEqual, NotGreater, NotLess, Equal, Less, Greater };
struct ComparisonOperator {
  std::string_view prefix;
  Comparison test;
};
constexpr std::array<ComparisonOperator, 6> kComparisons = {{
    {"<>", Comparison::NotEqual},
    {"<=", Comparison::NotGreater},
    {">=", Comparison::NotLess},
    {"=", Comparison::Equal},
    {"<", Comparison::Less},
    {">", Comparison::Greater},
}};

bool holds(Comparison test, QVOrdering ordering) {
  switch (test) {
    case Comparison::NotEqual: return ordering != QVOrdering::Same;
    case Comparison::NotGreater: return ordering != QVOrdering::Descending;
    case Comparison::NotLess: return ordering != QVOrdering::Ascending;
    case Comparison::Equal: return ordering == QVOrdering::Same;
    case Comparison::Less: return ordering == QVOrdering::Ascending;
    case Comparison::Greater: return ordering == QVOrdering::Descending;
  }
  return false;
}

// The user's election as a rule compares it: the stored integer (0 without
// one) taken as 32 bits, with bits 8 to 15 cleared, in decimal. So 0 to 255
// read as themselves and -1 reads "-65281". None when no server runs, or
// when called on the database's own queue, where asking it would wait on
// itself.
std::optional<std::string> electionText(const QVDPlugIn& plugIn) {
  const std::shared_ptr<QVDServer> server = QVDServer::server();
  if (!server) return std::nullopt;
  if (server->syncQueue()->isCurrent()) {
    QVLogOps().fault("election of %@ asked on the database queue; taken as absent",
                     plugIn.description());
    return std::nullopt;
  }
  const std::optional<platform::Dictionary> annotation = server->annotationForPlugIn(plugIn);
  const std::int64_t election =
      annotation ? electionInteger(annotation->get(QVAnnotationElectionKey)) : 0;
  const std::uint32_t bits = static_cast<std::uint32_t>(election) & 0xFFFF00FFu;
  return std::to_string(static_cast<std::int32_t>(bits));
}

}  // namespace

bool QVDPlugIn::match(const std::optional<platform::Dictionary>& rules) const {
  if (!rules) return true;
  for (const auto& [key, pattern] : *rules) {
    if (!matchKeyPattern(key, pattern)) return false;
  }
  return true;
}

bool QVDPlugIn::matchKeyPattern(const std::string& key, const Value& pattern) const {
  Value value;
  if (key.starts_with(kEntitlementKeyPrefix)) {
    // An entitlement is never stood in for by a manifest value: a plug-in
    // cannot claim one by writing it into its own Info.vmap.
    value = valueForEntitlement(std::string_view(key).substr(kEntitlementKeyPrefix.size()));
  } else {
    if (key == QVIdentifierAttribute) {
      if (std::optional<std::string> id = identifier()) value = Value(std::move(*id));
    } else if (key == QVUUIDAttribute) {
      if (std::optional<platform::Uuid> id = uuid()) value = Value(id->toString());
    } else if (key == QVUserElectionAttribute) {
      if (std::optional<std::string> election = electionText(*this)) {
        value = Value(std::move(*election));
      }
    } else if (key == QVContainingAppAttribute) {
      std::optional<std::string> containing = containingPath();
      // Even a false pattern fails: "not in an application" is not what
      // this key can ask.
      if (!containing) return false;
      value = Value(std::move(*containing));
    }
    if (value.isNone()) value = attribute(key);
    if (value.isNone()) value = infoKey(key);
  }

  // Property-list equality: a pattern 1 is true and 0 is false, and a value
  // 0 counts as false.
  if (pattern == Value(true)) return !value.isNone() && !(value == Value(false));
  if (pattern == Value(false)) return value.isNone() || value == Value(false);
  if (value.isNone()) return false;
  if (const platform::Dictionary* items = pattern.dictionary()) {
    return matchDictionaryPattern(value, *items);
  }
  if (value.string()) return matchValuePatterns(value, pattern);
  if (const platform::Array* list = value.array()) {
    for (const Value& element : *list) {
      if (element.string() && matchValuePatterns(element, pattern)) return true;
    }
  }
  return false;
}

bool QVDPlugIn::matchValuePatterns(const Value& value, const Value& patterns) const {
  const std::string* text = value.string();
  if (text == nullptr) return false;
  if (const std::string* pattern = patterns.string()) return matchValuePattern(*text, *pattern);
  if (const platform::Array* list = patterns.array()) {
    for (const Value& entry : *list) {
      const std::string* pattern = entry.string();
      if (pattern && matchValuePattern(*text, *pattern)) return true;
    }
  }
  return false;
}

bool QVDPlugIn::matchValuePattern(const std::string& value, const std::string& pattern) const {
  const std::string_view text(pattern);
  if (text.starts_with(kConformsOperator)) {
    return services_.types &&
           services_.types->conformsTo(value, text.substr(kConformsOperator.size()));
  }
  if (text.starts_with(kIsOperator)) {
    return services_.types && services_.types->conformsTo(text.substr(kIsOperator.size()), value);
  }
  if (text.starts_with('?')) {
    QVLogOps().info("unrecognized match operator:%@", pattern);
    return false;
  }
  for (const ComparisonOperator& op : kComparisons) {
    if (text.starts_with(op.prefix)) {
      return holds(op.test, compareVersionString(value, text.substr(op.prefix.size())));
    }
  }
  return compareVersionString(value, text) == QVOrdering::Same;
}

bool QVDPlugIn::matchDictionaryPattern(const Value& value,
                                       const platform::Dictionary& pattern) const {
  // The pattern is wrapped only when the line is wanted: it may be large.
  if (QVLogExtension().isEnabled(platform::log::Level::Debug)) {
    QVLogExtension().debug("evaluating XOExtension filter: %@ value: %@", Value(pattern), value);
  }
  return services_.types && services_.types->evaluateActivationRule(value, pattern);
}

}  // namespace qvd
