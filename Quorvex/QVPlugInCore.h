// QVPlugInCore: the plug-in record that the daemon and its clients share.
// A record describes one installed plug-in: identity (its UUID alone),
// location, containing application, manifest (the bundle's info dictionary
// and the plug-in dictionary under "XOExtension"), entitlements, localized
// names, annotations and bookkeeping values. It answers the derived
// questions the rest of the system asks about a plug-in, merges its manifest
// with its extension point's SDK dictionary, validates itself, and converts
// to and from the plug-in form that travels to clients.
//
// The daemon's registry-backed subclass reads its manifest and names from the
// registration service, so the manifest lookups, the getters of the fields
// it supplies itself, `diagnose` and `exportForm` are virtual.
//
// Thread safety: every field accessor is atomic and may be called from any
// thread; an operation that reads several fields (derived properties,
// export) may see a mix of old and new values while another thread changes
// the record.
#pragma once

#include <atomic>
#include <cstddef>
#include <cstdint>
#include <memory>
#include <optional>
#include <string>
#include <string_view>

#include "Quorvex/QVAtomicField.h"
#include "platform/holvane/SdkRegistry.h"
#include "platform/values/Error.h"
#include "platform/values/Uuid.h"
#include "platform/values/Value.h"

class QVPlugInCore {
 public:
  using DictionaryRef = std::shared_ptr<const platform::Dictionary>;

  QVPlugInCore() = default;
  virtual ~QVPlugInCore() = default;
  QVPlugInCore(const QVPlugInCore&) = delete;
  QVPlugInCore& operator=(const QVPlugInCore&) = delete;

  // ---- Construction (QVPlugInCoreSetup.cpp) ----

  // An empty record: no identity, no location, no manifest.
  static std::shared_ptr<QVPlugInCore> init();
  // A set-up record, or null when set-up fails (see setupWithName). When no
  // plug-in dictionary came from `bundleInfo`, `info` becomes the plug-in
  // dictionary. `url` is a file URL; `bundleInfo` should be a dictionary.
  static std::shared_ptr<QVPlugInCore> initWithName(std::optional<std::string> name,
                                                    std::optional<std::string> url,
                                                    const platform::Value& bundleInfo,
                                                    std::optional<platform::Dictionary> info,
                                                    std::optional<platform::Uuid> uuid);
  // Sets the record up; false (and the reason logged) without a url (silently),
  // without a name, or with a `bundleInfo` that is not a dictionary holding
  // an "XOExtension" dictionary. A missing uuid is replaced by a fresh one.
  // `info` is not read here.
  bool setupWithName(std::optional<std::string> name, std::optional<std::string> url,
                     const platform::Value& bundleInfo,
                     const std::optional<platform::Dictionary>& info,
                     std::optional<platform::Uuid> uuid);
  // Stores `info` as the info dictionary and its "XOExtension" as the plug-in
  // dictionary. False when `info` is not a dictionary (nothing changes) or
  // its "XOExtension" is not (the info dictionary is kept, the plug-in
  // dictionary is not changed).
  bool setDictionaries(const platform::Value& info);
  // The info dictionary to store for `info`; the base record keeps it as is.
  virtual platform::Value normalizeInfoDictionary(const platform::Value& info);

  // ---- Identity (QVPlugInCore.cpp) ----

  // Equal exactly when both records have the same uuid. A record without a
  // uuid (not set up) is equal only to itself.
  bool isEqual(const QVPlugInCore* other) const;
  bool operator==(const QVPlugInCore& other) const { return isEqual(&other); }
  // The hash of uuid (0 for a record without one).
  std::size_t hash() const;

  // ---- Fields (QVPlugInCore.cpp) ----

  bool onSystemVolume() const { return onSystemVolume_.load(); }
  void setOnSystemVolume(bool onSystemVolume) { onSystemVolume_.store(onSystemVolume); }
  DictionaryRef plugInDictionary() const { return plugInDictionary_.load(); }
  void setPlugInDictionary(std::optional<platform::Dictionary> d) {
    plugInDictionary_.store(std::move(d));
  }
  std::optional<std::string> identifier() const { return identifier_.copy(); }
  void setIdentifier(std::optional<std::string> s) { identifier_.store(std::move(s)); }
  virtual std::optional<std::string> originalIdentifier() const {
    return originalIdentifier_.copy();
  }
  void setOriginalIdentifier(std::optional<std::string> s) {
    originalIdentifier_.store(std::move(s));
  }
  // File URLs (QVFileURL.h).
  std::optional<std::string> url() const { return url_.copy(); }
  void setUrl(std::optional<std::string> s) { url_.store(std::move(s)); }
  std::optional<std::string> containingUrl() const { return containingUrl_.copy(); }
  void setContainingUrl(std::optional<std::string> s) { containingUrl_.store(std::move(s)); }
  virtual DictionaryRef bundleInfoDictionary() const { return bundleInfoDictionary_.load(); }
  void setBundleInfoDictionary(std::optional<platform::Dictionary> d) {
    bundleInfoDictionary_.store(std::move(d));
  }
  virtual DictionaryRef entitlements() const { return entitlements_.load(); }
  void setEntitlements(std::optional<platform::Dictionary> d) { entitlements_.store(std::move(d)); }
  std::uint32_t hubProtocolVersion() const { return hubProtocolVersion_.load(); }
  void setHubProtocolVersion(std::uint32_t v) { hubProtocolVersion_.store(v); }
  virtual std::optional<std::string> localizedName() const { return localizedName_.copy(); }
  virtual void setLocalizedName(std::optional<std::string> s) {
    localizedName_.store(std::move(s));
  }
  virtual std::optional<std::string> localizedShortName() const {
    return localizedShortName_.copy();
  }
  virtual void setLocalizedShortName(std::optional<std::string> s) {
    localizedShortName_.store(std::move(s));
  }
  virtual std::optional<std::string> localizedContainingName() const {
    return localizedContainingName_.copy();
  }
  virtual void setLocalizedContainingName(std::optional<std::string> s) {
    localizedContainingName_.store(std::move(s));
  }
  virtual DictionaryRef localizedStowageActionNames() const {
    return localizedStowageActionNames_.load();
  }
  virtual void setLocalizedStowageActionNames(std::optional<platform::Dictionary> d) {
    localizedStowageActionNames_.store(std::move(d));
  }
  DictionaryRef annotations() const { return annotations_.load(); }
  void setAnnotations(std::optional<platform::Dictionary> d) { annotations_.store(std::move(d)); }
  // Whole seconds since the Unix epoch.
  std::int32_t lastModified() const { return lastModified_.load(); }
  void setLastModified(std::int32_t seconds) { lastModified_.store(seconds); }
  std::optional<platform::Uuid> uuid() const { return uuid_.copy(); }
  void setUuid(std::optional<platform::Uuid> u) { uuid_.store(std::move(u)); }
  std::optional<platform::Data> cdhash() const { return cdhash_.copy(); }
  void setCdhash(std::optional<platform::Data> d) { cdhash_.store(std::move(d)); }
  std::optional<std::string> requirement() const { return requirement_.copy(); }
  void setRequirement(std::optional<std::string> s) { requirement_.store(std::move(s)); }
  // The plug-in's sandbox data container; the base record has none.
  virtual std::optional<std::string> dataContainerURL() const { return std::nullopt; }

  // ---- Manifest lookups (QVPlugInCore.cpp); none when absent ----

  // bundleInfoDictionary[key], logged at debug level ("hv").
  virtual platform::Value infoKey(std::string_view key) const;
  // plugInDictionary[key].
  virtual platform::Value pluginKey(std::string_view key) const;
  // attributes[key].
  virtual platform::Value attribute(std::string_view key) const;

  // ---- Derived properties (QVPlugInCore.cpp); computed on every call ----

  std::optional<std::string> path() const;
  std::optional<std::string> containingPath() const;
  // "XOExtensionAttributes" when it is a dictionary, else none.
  platform::Value attributes() const;
  platform::Value version() const;
  // The extension point's identifier, as the manifest states it (any kind).
  platform::Value sdkSpec() const;
  // A string, a list of strings, or none; "XOObject" for an application
  // extension that names none.
  platform::Value protocolSpec() const;
  platform::Value principalSpec() const;
  platform::Value embeddedProtocolSpec() const;
  // Always none: embedded code is not supported.
  std::optional<std::string> embeddedCodePath() const { return std::nullopt; }
  bool isAppExtension() const;
  // Always false: multiplexing is obsolete.
  bool isMultiplexed() const { return false; }
  bool isHybrid() const;
  bool isDedicated() const;
  bool isData() const;
  // Whether the manifest uses the old style ("Quorvex" rather than
  // "XOExtension"). A manifest with neither is logged as an internal
  // inconsistency and counts as old style.
  bool oldStyle() const;
  platform::Date timestamp() const;

  // Replaces annotations by a copy in which `key` holds `value`, or lacks
  // `key` when `value` is none. A record without annotations starts from an
  // empty dictionary. The previous dictionary is never modified.
  void setAnnotationValue(std::string_view key, platform::Value value);

  // ---- SDK resolution and validation (QVPlugInCoreSDK.cpp) ----

  // Merges the manifest with the SDK dictionary that `registry` holds for
  // sdkSpec (the plug-in's values win), then canonicalises. Without
  // bundleInfoDictionary nothing changes (logged as a fault).
  void resolveSDK(const platform::holvane::SdkRegistry& registry);
  // The SDK dictionary of `extensionPointIdentifier`, or none (logged when
  // not registered or unreadable).
  static std::optional<platform::Dictionary> readSDKDictionary(
      const platform::holvane::SdkRegistry& registry, std::string_view extensionPointIdentifier);
  // `target` with `source` merged in, level by level; neither is modified.
  static platform::Dictionary mergeDictionaryInto(const platform::Dictionary& source,
                                                  const platform::Dictionary& target);
  // True exactly for "CleanTimeout": the one key where the SDK wins.
  static bool sdkOverridesKey(std::string_view key);
  // The union of both lists without duplicates: target's entries first, then
  // source's new ones.
  static platform::Array mergeSharedResourcesInto(const platform::Array& source,
                                                  const platform::Array& target);
  // Gives plugInDictionary an attributes dictionary with a version in it.
  void canonicalize();
  // None for an acceptable plug-in, else the first problem (Quorvex domain,
  // code 12).
  virtual std::optional<platform::Error> diagnose() const;

  // ---- Plug-in form (QVPlugInCoreForm.cpp) ----

  // The record's form, or none with `*error` set (when error is not null)
  // when the record lacks a value the form requires.
  virtual std::optional<platform::Dictionary> exportForm(
      std::optional<platform::Error>* error) const;
  // A record rebuilt from a form, or null when set-up fails.
  static std::shared_ptr<QVPlugInCore> initWithForm(const platform::Dictionary& form);
  bool setupWithForm(const platform::Dictionary& form);
  // Takes the form's annotations (none when absent); nothing else changes.
  void updateFromForm(const platform::Dictionary& form);

  // Text for "%@" in logs: identifier and uuid.
  std::string description() const;

 protected:
  // What initWithName does to a freshly made record, for subclasses that
  // make their own: set-up, then `info` as the plug-in dictionary when the
  // info dictionary supplied none.
  bool initFieldsWithName(std::optional<std::string> name, std::optional<std::string> url,
                          const platform::Value& bundleInfo,
                          std::optional<platform::Dictionary> info,
                          std::optional<platform::Uuid> uuid);

 private:
  std::atomic<bool> onSystemVolume_{false};
  QVAtomicField<platform::Dictionary> plugInDictionary_;
  QVAtomicField<std::string> identifier_;
  QVAtomicField<std::string> originalIdentifier_;
  QVAtomicField<std::string> url_;
  QVAtomicField<std::string> containingUrl_;
  QVAtomicField<platform::Dictionary> bundleInfoDictionary_;
  QVAtomicField<platform::Dictionary> entitlements_;
  std::atomic<std::uint32_t> hubProtocolVersion_{0};
  QVAtomicField<std::string> localizedName_;
  QVAtomicField<std::string> localizedShortName_;
  QVAtomicField<std::string> localizedContainingName_;
  QVAtomicField<platform::Dictionary> localizedStowageActionNames_;
  QVAtomicField<platform::Dictionary> annotations_;
  std::atomic<std::int32_t> lastModified_{0};
  QVAtomicField<platform::Uuid> uuid_;
  QVAtomicField<platform::Data> cdhash_;
  QVAtomicField<std::string> requirement_;
};

// Hashing and equality of records held by pointer, by their identity, for
// unordered sets and maps of records (the plug-ins a hold blocks).
struct QVPlugInCoreHash {
  template <typename Pointer>
  std::size_t operator()(const Pointer& record) const {
    return record ? record->hash() : 0;
  }
};
struct QVPlugInCoreEqual {
  template <typename A, typename B>
  bool operator()(const A& a, const B& b) const {
    if (!a || !b) return !a && !b;
    return a->isEqual(&*b);
  }
};

template <>
struct std::hash<QVPlugInCore> {
  std::size_t operator()(const QVPlugInCore& record) const { return record.hash(); }
};
