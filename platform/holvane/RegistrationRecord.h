// What the registration service keeps about a plug-in and about the
// application that contains it. Records are snapshots: a change to the
// database makes new records, it never alters one already handed out.
//
// Thread safety: plain values; copy and read them from any thread.
#pragma once

#include <optional>
#include <string>

#include "platform/values/Uuid.h"
#include "platform/values/Value.h"

namespace platform::holvane {

// Keys the service reads from or adds to an info dictionary.
inline constexpr std::string_view kExtensionKey = "XOExtension";
inline constexpr std::string_view kExtensionIdentifierKey = "XOExtensionIdentifier";
inline constexpr std::string_view kExtensionPointIdentifierKey = "XOExtensionPointIdentifier";
inline constexpr std::string_view kExtensionPointNameKey = "XOExtensionPointName";
inline constexpr std::string_view kExtensionAttributesKey = "XOExtensionAttributes";
inline constexpr std::string_view kExtensionProtocolKey = "XOExtensionProtocol";
inline constexpr std::string_view kDataProtocol = "#Data";
inline constexpr std::string_view kBundleIdentifierKey = "BXBundleIdentifier";
inline constexpr std::string_view kBundleVersionKey = "BXBundleVersion";
inline constexpr std::string_view kBundleShortVersionKey = "BXBundleShortVersionString";
inline constexpr std::string_view kBundleExecutableKey = "BXExecutable";
inline constexpr std::string_view kBundleInfoVmapUrlKey = "BXBundleInfoVmapURL";

enum class Volume { System, Other };
enum class ExecutablePresence { Present, Placeholder };

struct ApplicationRecord {
  std::string path;  // canonical, no trailing separator
  std::optional<std::string> bundleIdentifier;
  // <app>/<BXExecutable> when that file exists; an application without one
  // is a placeholder (for instance, one still being installed).
  std::optional<std::string> executablePath;
  Date registered;
  Dictionary info;  // the application's Info.vmap as read

  ExecutablePresence presence() const {
    return executablePath ? ExecutablePresence::Present : ExecutablePresence::Placeholder;
  }
  bool operator==(const ApplicationRecord&) const = default;
};

struct PlugInRecord {
  Uuid uuid;          // assigned at the first registration of `path`, then kept
  std::string path;   // canonical bundle directory, no trailing separator
  std::string identifier;          // XOExtensionIdentifier, else BXBundleIdentifier
  std::string originalIdentifier;  // the identifier of the first registration
  std::optional<std::string> bundleIdentifier;
  std::optional<std::string> version;  // BXBundleVersion, else BXBundleShortVersionString
  // The XOExtensionPointName of the attributes: what filtered queries select on.
  std::optional<std::string> extensionPointName;
  Date registered;
  Volume volume = Volume::Other;
  std::optional<Dictionary> entitlements;  // none when they could not be read
  std::optional<std::string> dataContainer;  // none for a data plug-in
  // The Info.vmap merged with its SDK dictionary, with BXBundleInfoVmapURL.
  Dictionary info;
  std::optional<std::string> containingApplicationPath;

  // The XOExtension dictionary of `info`, or none.
  const Dictionary* plugInDictionary() const { return info.get(kExtensionKey).dictionary(); }
  bool operator==(const PlugInRecord&) const = default;
};

}  // namespace platform::holvane
