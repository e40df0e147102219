// QVDPlugIn: the daemon's plug-in record, built from the
// registration service's record of a plug-in. Where the base record reads
// stored dictionaries, this one reads the registration service's current
// view: its info dictionary and localized names are fetched afresh from a
// current registration record whenever the registration generation has
// changed, and kept otherwise. It validates itself when built, exposes its
// entitlements, names the key its annotations are kept under, and adds to a
// plug-in form the sandbox tokens a host needs to reach the plug-in.
//
// Thread safety: safe from any thread. Fields set at construction never
// change afterwards; the five caches (info dictionary and four localized
// values) share one generation stamp and are refreshed under one recursive
// lock, while single reads and the localized setters are atomic and lock-free
// with respect to that lock.
#pragma once

#include <memory>
#include <mutex>
#include <optional>
#include <set>
#include <string>
#include <string_view>

#include "Quorvex/QVAtomicField.h"
#include "Quorvex/QVPlugInCore.h"
#include "platform/holvane/RegistrationRecord.h"
#include "platform/holvane/Registry.h"
#include "platform/locale/LocaleService.h"
#include "platform/lumend/ServiceManager.h"
#include "platform/pvg/ConsentService.h"
#include "platform/sandbox/SandboxExtensions.h"
#include "platform/types/TypeRegistry.h"
#include "platform/values/Error.h"
#include "platform/values/Uuid.h"
#include "platform/values/Value.h"
#include "platform/vouchd/AssertionService.h"
#include "qvd/QVDAnnotated.h"

namespace qvd {

class QVDMbxClient;

// The entitlement whose string value names the plug-in whose annotations
// this one takes over.
inline constexpr std::string_view QVDReplacePlugInEntitlement =
    "com.corvane.developer.replace-plugin";
// The strings tables localized names and Stowage action titles come from.
inline constexpr std::string_view QVDInfoStringsTable = "InfoPlist";
inline constexpr std::string_view QVDActionStringsTable = "Localizable";

class QVDPlugIn final : public QVPlugInCore, public QVDAnnotated {
 public:
  // The platform services a plug-in keeps for its whole life: the
  // registration service (fresh records, generation), the locale (names)
  // and the token issuer (augmentForm).
  struct Services {
    std::shared_ptr<const platform::holvane::Registry> registry;
    std::shared_ptr<const platform::locale::LocaleService> locale;
    std::shared_ptr<const platform::sandbox::SandboxExtensions> extensions;
    // Type conformance and activation rules for match rules. May be null:
    // then type operators and dictionary patterns match nothing.
    std::shared_ptr<const platform::types::TypeRegistry> types = nullptr;
    // The service manager that enabling tells. May be null: then enabling
    // fails as a refusal does.
    std::shared_ptr<platform::lumend::ServiceManager> serviceManager = nullptr;
    // The privacy consents of containing applications. May be null: then
    // none is granted.
    std::shared_ptr<const platform::pvg::ConsentService> consents = nullptr;
  };

  // ---- Construction and validation (QVDRegistryPlugIn.cpp) ----

  // The plug-in of `record`, or null when the record has no location or
  // identifier, or the plug-in fails `diagnose` (logged). Localized names
  // are not fetched here.
  // REQUIRES: every service in `services` but `types` is non-null.
  static std::shared_ptr<QVDPlugIn> initWithHVData(const platform::holvane::PlugInRecord& record,
                                                   Services services);

  // A current registration record of this plug-in: the lent one while it
  // is current, else by UUID, else by path.
  std::optional<platform::holvane::PlugInRecord> getProxy() const;
  // Lends `record`, read from the registry at `generation` or later. It is
  // held weakly: the lender decides how long it lives, and getProxy uses it
  // only while the registry is still at `generation`. A request about
  // thousands of plug-ins lends the records its query just read, so that
  // their exports do not read each one again.
  void lendRecord(const platform::Uuid& generation,
                  const std::shared_ptr<const platform::holvane::PlugInRecord>& record) const;

  // Entries stay in the daemon's cache until a purge or an uninstall.
  bool isStillValid() const { return true; }

  // The base validation, then: a data container for all but data plug-ins,
  // and a location on the system volume for plug-ins outside applications.
  std::optional<platform::Error> diagnose() const override;

  // ---- Entitlements and annotation key (QVDRegistryPlugIn.cpp) ----

  // entitlements and originalIdentifier are the base record's fields, set
  // from the registration record at construction.
  std::optional<std::string> dataContainerURL() const override { return dataContainerURL_.copy(); }
  // entitlements[key], or none.
  platform::Value valueForEntitlement(std::string_view key) const;
  // Held unless absent, false or 0.
  bool hasEntitlement(std::string_view key) const;
  // The replace-plugin entitlement when it is a string, else identifier.
  std::string annotationKey() const override;

  // ---- Cached views of the registration service (QVDRegistryPlugInCaches.cpp) ----

  // The current info dictionary (none when no current record exists).
  DictionaryRef bundleInfoDictionary() const override;
  // (infoKey "XOExtension")[key]: the current manifest, unlike the base,
  // which reads the plug-in dictionary stored at construction.
  platform::Value pluginKey(std::string_view key) const override;
  // Names answer "" and action names an empty dictionary rather than none.
  std::optional<std::string> localizedName() const override;
  std::optional<std::string> localizedShortName() const override;
  std::optional<std::string> localizedContainingName() const override;
  DictionaryRef localizedStowageActionNames() const override;
  // Replace the cached value atomically, without the plug-in's lock.
  void setLocalizedName(std::optional<std::string> s) override { name_.store(std::move(s)); }
  void setLocalizedShortName(std::optional<std::string> s) override {
    shortName_.store(std::move(s));
  }
  void setLocalizedContainingName(std::optional<std::string> s) override {
    containingName_.store(std::move(s));
  }
  void setLocalizedStowageActionNames(std::optional<platform::Dictionary> d) override {
    actionNames_.store(std::move(d));
  }

  // ---- Form and Stowage (QVDRegistryPlugInForm.cpp) ----

  // Adds "extensions" (tokens for the shared resources, "." for an
  // application extension) and, for plug-ins other than data plug-ins,
  // "service-extension" when one can be issued.
  void augmentForm(platform::Dictionary& form) const;
  // Action name to localized title for the Stowage actions in `qvdict`,
  // looked up in the "Localizable" table of `record`'s bundle; a name
  // without a translation stands for itself.
  platform::Dictionary localizedStowageActionNamesForQVDict(
      const platform::holvane::PlugInRecord& record, const platform::Dictionary& qvdict) const;
  // `info` without its entries whose key begins with "DT".
  static platform::Dictionary prunedInfoDictionaryFor(const platform::Dictionary& info);

  // ---- Match rules (QVDRegistryPlugInMatching.cpp) ----
  // A rule set maps keys naming a property of the plug-in to patterns. The
  // evaluator only reads and never fails: a malformed piece does not match.

  // Whether every entry of `rules` matches, in the set's order, stopping at
  // the first that does not. None or an empty set matches every plug-in.
  bool match(const std::optional<platform::Dictionary>& rules) const;
  // One entry: "ENTITLEMENT:<name>" reads that entitlement and nothing
  // else; "XOExtensionIdentifier", "com.corvane.uuid", "XOUserElection" and
  // "XOExtensionContainingApp" read those properties (a plug-in without a
  // containing application fails the last whatever the pattern); any other
  // key, or one of those whose property is absent, reads the attributes,
  // then the info dictionary. Then: true matches a present value other than
  // false, false an absent or false one; a dictionary is the host's items
  // for the value taken as an activation rule; anything else needs a string
  // (or a list with a string element) that matches the pattern list.
  bool matchKeyPattern(const std::string& key, const platform::Value& pattern) const;
  // A string value against a pattern list: one string pattern, or a list of
  // which one string must match. Anything else matches nothing.
  bool matchValuePatterns(const platform::Value& value, const platform::Value& patterns) const;
  // One string pattern. Operators, the first prefix that fits: "?KT-CONFORMS:"
  // (value conforms to operand), "?KT-IS:" (operand conforms to value), any
  // other "?" (no match, logged), "<>", "<=", ">=", "=", "<", ">"; without
  // one, equality with the whole pattern. Comparison is compareVersionString.
  bool matchValuePattern(const std::string& value, const std::string& pattern) const;
  // The platform's activation-rule evaluation of `value` (the rule) against
  // `pattern` (the host's items), logged at debug level.
  bool matchDictionaryPattern(const platform::Value& value,
                              const platform::Dictionary& pattern) const;

  // ---- Host permission (QVDRegistryPlugInPermission.cpp) ----

  // None when `client` may use this plug-in, else why not: the host's
  // "com.corvane.developer.quorvex.allowedplugins" must be a rule set this
  // plug-in matches (when present), and the host must hold the entitlement
  // the plug-in names in "XOExtensionHostEntitlement" (when present).
  std::optional<std::string> allowForClient(const QVDMbxClient& client) const;
  // The same, given the host's entitlements as read once for a request that
  // asks about many plug-ins.
  std::optional<std::string> allowForClient(const platform::Dictionary& hostEntitlements) const;

  // ---- Enabling (QVDRegistryPlugInEnabling.cpp) ----

  // Lets `client` run this plug-in as a service: hands the service manager
  // the plug-in's executable and an overlay of {"MBXService": the
  // manifest's service dictionary with the merged environment and the
  // sandbox profile, "BXBundlePackageType": "MBX!"}. The environment is the
  // host's, then the data container's HOME, BXFIXED_USER_HOME and TMPDIR,
  // then QVTEST_SDK from the daemon's own, then the plug-in's declared
  // variables, each replacing the one before. None on success, else a
  // code-4 error. Blocks on the service manager.
  std::optional<platform::Error> enableForClient(
      const QVDMbxClient& client, const std::optional<platform::Dictionary>& environment) const;
  // The consent services granted to the containing application; empty
  // without one, or when the consents cannot be read (logged). Read afresh
  // on every call.
  std::set<std::string> allowedPVGServices() const;
  // The sandbox profile enabling assigns, by extension point.
  std::string sandboxProfile() const;

  // ---- Busy (QVDRegistryPlugInBusy.cpp) ----

  // The busy token of this plug-in, {BXBundleIdentifier: identifier}, when
  // `assertions` reports a busy running instance of its bundle; none when
  // it reports none (or cannot answer, which is logged).
  std::optional<platform::Dictionary> checkBusy(
      const platform::vouchd::AssertionService& assertions) const;

 private:
  enum class LocalizedCache { Name, ShortName, ContainingName, StowageActionNames };

  explicit QVDPlugIn(Services services) : services_(std::move(services)) {}

  // Whether `generation` is the stamp the caches were refreshed at.
  bool isFresh(const platform::Uuid& generation) const;
  // Refreshes `which` when it is empty or stale; the caller reads it after.
  void refreshLocalized(LocalizedCache which) const;
  bool hasLocalized(LocalizedCache which) const;
  void storeLocalizedFrom(LocalizedCache which,
                          const std::optional<platform::holvane::PlugInRecord>& record) const;
  std::optional<std::string> containingNameOf(const platform::holvane::PlugInRecord& record) const;
  // Sets the form's service token: `remembered` when it holds one, else a
  // new one, which it then holds.
  void addServiceExtension(platform::Dictionary& form,
                           std::optional<std::string>& remembered) const;
  std::string currentLocale() const;
  void logNoFreshProxy() const;

  const Services services_;
  QVAtomicField<std::string> dataContainerURL_;
  // The caches; one stamp serves all five.
  mutable QVAtomicField<std::string> name_;
  mutable QVAtomicField<std::string> shortName_;
  mutable QVAtomicField<std::string> containingName_;
  mutable QVAtomicField<platform::Dictionary> actionNames_;
  mutable QVAtomicField<platform::Dictionary> infoVmap_;
  mutable QVAtomicField<platform::Uuid> hvKnowledgeUUID_;
  // Tokens that name only what the registration fixes: the whole bundle and
  // the service. A token is a signature over its subject, so issuing again
  // in the same registration generation gives the same text; every find
  // and match would otherwise resolve the bundle path and sign anew.
  // Entries inside the bundle are always issued afresh: their links are
  // checked each time.
  struct IssuedTokens {
    platform::Uuid generation;
    std::optional<std::string> wholeBundle;
    std::optional<std::string> service;
  };
  mutable QVAtomicField<IssuedTokens> issuedTokens_;
  mutable std::recursive_mutex lock_;
  // The generation whose record named no containing application; guarded by
  // lock_. The nil UUID when none did (no generation is nil).
  mutable platform::Uuid noContainerAt_;
  // The lent record and the generation it is current at.
  mutable std::mutex lentLock_;
  mutable platform::Uuid lentGeneration_;
  mutable std::weak_ptr<const platform::holvane::PlugInRecord> lent_;
};

}  // namespace qvd
