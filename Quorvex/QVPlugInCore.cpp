// Identity, manifest lookups and derived properties of the plug-in record.
#include "Quorvex/QVPlugInCore.h"

#include "Quorvex/QVFileURL.h"
#include "Quorvex/QVLog.h"
#include "Quorvex/QVPlugInConstants.h"
#include "Quorvex/SmallDictionaryChanges.h"

namespace {

std::optional<std::string> pathOfURL(const std::optional<std::string>& url) {
  if (!url) return std::nullopt;
  return QVPathFromFileURL(*url);
}

platform::Value lookup(const QVPlugInCore::DictionaryRef& dictionary, std::string_view key) {
  if (!dictionary) return platform::Value();
  return dictionary->get(key);
}

}  // namespace

bool QVPlugInCore::isEqual(const QVPlugInCore* other) const {
  if (other == nullptr) return false;
  if (other == this) return true;
  const std::optional<platform::Uuid> mine = uuid();
  const std::optional<platform::Uuid> theirs = other->uuid();
  // A record without identity has not been set up; it cannot stand for any
  // plug-in, so it matches no other record.
  return mine && theirs && *mine == *theirs;
}

std::size_t QVPlugInCore::hash() const {
  const std::optional<platform::Uuid> id = uuid();
  return id ? platform::UuidHash()(*id) : 0;
}

platform::Value QVPlugInCore::infoKey(std::string_view key) const {
  platform::Value value = lookup(bundleInfoDictionary(), key);
  QVLogHV().debug("%s %@ => %@", "-[QVPlugInCore infoKey:]", key, value);
  return value;
}

platform::Value QVPlugInCore::pluginKey(std::string_view key) const {
  return lookup(plugInDictionary(), key);
}

platform::Value QVPlugInCore::attribute(std::string_view key) const {
  const platform::Value attrs = attributes();
  const platform::Dictionary* dictionary = attrs.dictionary();
  return dictionary ? dictionary->get(key) : platform::Value();
}

std::optional<std::string> QVPlugInCore::path() const {
  return pathOfURL(url());
}

std::optional<std::string> QVPlugInCore::containingPath() const {
  return pathOfURL(containingUrl());
}

platform::Value QVPlugInCore::attributes() const {
  platform::Value attrs = pluginKey(QVExtensionAttributesKey);
  return attrs.dictionary() ? attrs : platform::Value();
}

platform::Value QVPlugInCore::version() const {
  return attribute(QVExtensionVersionKey);
}

platform::Value QVPlugInCore::sdkSpec() const {
  return pluginKey(QVExtensionPointIdentifierKey);
}

platform::Value QVPlugInCore::protocolSpec() const {
  platform::Value spec = pluginKey(QVExtensionProtocolKey);
  if (spec.isNone() && isAppExtension()) return platform::Value(QVDefaultProtocol);
  return spec;
}

platform::Value QVPlugInCore::principalSpec() const {
  platform::Value spec = pluginKey(QVPrincipalClassKey);
  if (spec.isNone() && isAppExtension()) return platform::Value(QVDefaultProtocol);
  return spec;
}

platform::Value QVPlugInCore::embeddedProtocolSpec() const {
  platform::Value spec = pluginKey(QVEmbeddedProtocolKey);
  return spec.isNone() ? protocolSpec() : spec;
}

bool QVPlugInCore::isAppExtension() const {
  const std::optional<std::string> p = path();
  return p && p->ends_with(QVAppExtensionSuffix);
}

bool QVPlugInCore::isHybrid() const {
  return !pluginKey(QVEmbeddedCodeKey).isNone();
}

bool QVPlugInCore::isDedicated() const {
  return pluginKey(QVDedicatedKey).truth().value_or(false);
}

bool QVPlugInCore::isData() const {
  return protocolSpec() == platform::Value(QVDataProtocol);
}

bool QVPlugInCore::oldStyle() const {
  if (!infoKey(QVExtensionInfoKey).isNone()) return false;
  if (!infoKey(QVOldStyleInfoKey).isNone()) return true;
  // A record built from a manifest always has one of the two; only a record
  // assembled by hand gets here. Answer like the older style, which asks the
  // least of a plug-in, rather than stop.
  QVLogOps().fault("unknown plug-in configuration style");
  return true;
}

platform::Date QVPlugInCore::timestamp() const {
  return platform::Date{static_cast<double>(lastModified())};
}

void QVPlugInCore::setAnnotationValue(std::string_view key, platform::Value value) {
  const DictionaryRef current = annotations();
  setAnnotations(
      dictionaryChangingTo(current ? *current : platform::Dictionary(), key, std::move(value)));
}

std::string QVPlugInCore::description() const {
  const std::optional<platform::Uuid> id = uuid();
  return "<QVPlugInCore " + identifier().value_or("(no identifier)") + " " +
         (id ? id->toString() : std::string("(no uuid)")) + ">";
}
