// The vocabulary of plug-in manifests and plug-in forms: the keys a plug-in
// bundle's Info.vmap uses to describe itself, and the keys of the dictionary
// form in which records travel to clients. The texts are written by plug-in
// authors and read by clients, so they never change.
//
// Thread safety: constants only.
#pragma once

#include <string_view>

// Info-dictionary level.
inline constexpr std::string_view QVExtensionInfoKey = "XOExtension";  // the plug-in dictionary
inline constexpr std::string_view QVOldStyleInfoKey = "Quorvex";       // old manifest style marker
inline constexpr std::string_view QVBundleIdentifierKey = "BXBundleIdentifier";
inline constexpr std::string_view QVBundleDisplayNameKey = "BXBundleDisplayName";
inline constexpr std::string_view QVBundleShortVersionStringKey = "BXBundleShortVersionString";
inline constexpr std::string_view QVBundleNameKey = "BXBundleName";
// Where the manifest file lies; a detail of the registration service that
// clients never see.
inline constexpr std::string_view QVBundleInfoVmapURLKey = "BXBundleInfoVmapURL";

// Plug-in-dictionary level.
inline constexpr std::string_view QVExtensionPointIdentifierKey = "XOExtensionPointIdentifier";
inline constexpr std::string_view QVExtensionAttributesKey = "XOExtensionAttributes";
inline constexpr std::string_view QVExtensionProtocolKey = "XOExtensionProtocol";
inline constexpr std::string_view QVPrincipalClassKey = "PrincipalClass";
inline constexpr std::string_view QVEmbeddedCodeKey = "EmbeddedCode";
inline constexpr std::string_view QVEmbeddedProtocolKey = "EmbeddedProtocol";
inline constexpr std::string_view QVDedicatedKey = "Dedicated";
inline constexpr std::string_view QVPassProxyKey = "PassProxy";
inline constexpr std::string_view QVMultipleKey = "Multiple";
inline constexpr std::string_view QVHubProtocolVersionKey = "HubProtocolVersion";
inline constexpr std::string_view QVSharedResourcesInfoKey = "Shared";
inline constexpr std::string_view QVCleanTimeoutKey = "CleanTimeout";
inline constexpr std::string_view QVExtensionStowageActionsKey = "XOExtensionStowageActions";
inline constexpr std::string_view QVExtensionStowageActionNameKey = "XOExtensionStowageActionName";

// Attributes level.
inline constexpr std::string_view QVExtensionVersionKey = "XOExtensionVersion";

// Values with a meaning of their own.
// The protocol and principal class of an application extension that names none.
inline constexpr std::string_view QVDefaultProtocol = "XOObject";
// The protocol of a data plug-in: one that carries files, not code.
inline constexpr std::string_view QVDataProtocol = "#Data";
// An application extension's bundle name ends with this.
inline constexpr std::string_view QVAppExtensionSuffix = ".ovx";
// The version of a plug-in that states none anywhere.
inline constexpr std::string_view QVDefaultExtensionVersion = "1";
// The "version" of a form whose record has no version.
inline constexpr std::string_view QVFormNoVersion = "<none>";

// Plug-in form keys, in the order in which a record writes them. The
// annotations key is QVAnnotationsFormKey (QVDConstants.h).
inline constexpr std::string_view QVFormHubProtocolVersionKey = "hubProtocolVersion";
inline constexpr std::string_view QVFormPathKey = "path";
inline constexpr std::string_view QVFormSystemResidentKey = "systemResident";
inline constexpr std::string_view QVFormIdentifierKey = "identifier";
inline constexpr std::string_view QVFormOriginalIdentifierKey = "original-identifier";
inline constexpr std::string_view QVFormVersionKey = "version";
inline constexpr std::string_view QVFormBundleInfoKey = "bundleInfo";
inline constexpr std::string_view QVFormInfoKey = "info";
inline constexpr std::string_view QVFormUUIDKey = "uuid";
inline constexpr std::string_view QVFormLastModifiedKey = "lastmodified";
inline constexpr std::string_view QVFormEntitlementsKey = "entitlements";
inline constexpr std::string_view QVFormContainingPathKey = "containingPath";
inline constexpr std::string_view QVFormLocalizedContainingNameKey =
    "localizedContainingDisplayName";
inline constexpr std::string_view QVFormLocalizedNameKey = "localizedDisplayName";
inline constexpr std::string_view QVFormLocalizedShortNameKey = "localizedShortName";
inline constexpr std::string_view QVFormLocalizedStowageActionNamesKey =
    "localizedStowageActionNames";
// Added by others than the record itself and never read back into a record:
// the token keys "extensions" and "service-extension"
// (QVSandboxExtensionConstants.h) and the override links of a match.
inline constexpr std::string_view QVOverriderFormKey = "overrider";
inline constexpr std::string_view QVOverridingFormKey = "overriding";
// Accepted when read, never written by the daemon.
inline constexpr std::string_view QVFormHashKey = "hash";
inline constexpr std::string_view QVFormRequirementKey = "requirement";

// Hub protocol version of a form that states none.
inline constexpr unsigned QVFormDefaultHubProtocolVersion = 1;
