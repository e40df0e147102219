// The protocol's vocabulary, shared by the daemon and its clients: message
// keys, request names, the protocol version, discovery flags, notification
// and preference names, and the entitlements the daemon reads. The texts
// travel on the wire and in files, so they never change.
//
// Thread safety: constants only.
#pragma once

#include <cstdint>
#include <string_view>

// The service the daemon listens on unless told otherwise.
inline constexpr std::string_view QVDServiceName = "com.corvane.quorvex.qvd";

// Protocol versions: the client library sends the current one; the daemon
// also accepts the previous one.
inline constexpr std::uint64_t QVDProtocolVersion = 3;
inline constexpr std::uint64_t QVDPreviousProtocolVersion = 2;

// Message keys.
inline constexpr std::string_view QVDRequestKey = "request";
inline constexpr std::string_view QVDVersionKey = "version";
inline constexpr std::string_view QVDSynchronousRequestKey = "sync";
inline constexpr std::string_view QVDPathsKey = "paths";
inline constexpr std::string_view QVDUUIDKey = "uuids";
inline constexpr std::string_view QVDFlagsKey = "flags";
inline constexpr std::string_view QVDRulesKey = "rules";
inline constexpr std::string_view QVDEnvironmentKey = "environment";
inline constexpr std::string_view QVDAnnotationsKey = "annotations";
inline constexpr std::string_view QVDMatchesKey = "matches";
inline constexpr std::string_view QVDExtensionsKey = "extensions";
inline constexpr std::string_view QVDConflictsKey = "conflicts";
inline constexpr std::string_view QVDErrorCodeKey = "errorcode";
inline constexpr std::string_view QVDErrorKey = "error";

// Request names, in the order the daemon matches them.
inline constexpr std::string_view QVDAddRequest = "add";
inline constexpr std::string_view QVDRemoveRequest = "remove";
inline constexpr std::string_view QVDBulkRequest = "bulk";
inline constexpr std::string_view QVDMatchRequest = "match";
inline constexpr std::string_view QVDReadyRequest = "ready";
inline constexpr std::string_view QVDAccessRequest = "access";
inline constexpr std::string_view QVDAnnotateRequest = "annotate";
inline constexpr std::string_view QVDBulkAnnotateRequest = "bulk-annotate";
inline constexpr std::string_view QVDLockdownRequest = "lock";
inline constexpr std::string_view QVDFindRequest = "find";

// Discovery flags of "match".
enum QVDiscoverFlags : std::uint64_t {
  QVDiscoverKeepVersions = 0x1,
  QVDiscoverKeepDuplicates = 0x4,
  QVDiscoverSystemOnly = 0x8,
  QVDiscoverAll = 0x200,
  // Client side only: the client library sends the request synchronously.
  QVDiscoverSynchronous = 0x400,
};

// Posted after annotation and hold changes.
inline constexpr std::string_view QVNotifyAnnotationChange = "com.corvane.quorvex.annotation-change";

// The daemon's preferences.
inline constexpr std::string_view QVPreferenceDomain = "com.corvane.quorvex.userprefs";
inline constexpr std::string_view QVExclusionsPreferenceKey = "exclusions";

// Entitlements the daemon reads from clients and plug-ins.
inline constexpr std::string_view QVManagerEntitlement = "com.corvane.private.quorvex.manager";
inline constexpr std::string_view QVAllowedPlugInsEntitlement =
    "com.corvane.developer.quorvex.allowedplugins";
inline constexpr std::string_view QVEnvironmentProvisionEntitlement =
    "com.corvane.developer.quorvex.provide-environment";
inline constexpr std::string_view QVOverrideEntitlement = "com.corvane.developer.replace-plugin";
inline constexpr std::string_view QVAutoElectEntitlement = "com.corvane.developer.auto-elect-plugin";

// Manifest and rule keys with a meaning of their own.
inline constexpr std::string_view QVHostEntitlementInfoKey = "XOExtensionHostEntitlement";
inline constexpr std::string_view QVIdentifierAttribute = "XOExtensionIdentifier";
inline constexpr std::string_view QVContainingAppAttribute = "XOExtensionContainingApp";
inline constexpr std::string_view QVUserElectionAttribute = "XOUserElection";
inline constexpr std::string_view QVUUIDAttribute = "com.corvane.uuid";
inline constexpr std::string_view QVProtocolAttribute = "XOExtensionPointName";
inline constexpr std::string_view QVAnnotationsFormKey = "annotations";
// The entries of an annotation that a client may set; the daemon drops any
// other. The election is an integer (1 elected, 0 or absent undecided, any
// other value the user's own decision); the extension a dictionary.
inline constexpr std::string_view QVAnnotationElectionKey = "election";
inline constexpr std::string_view QVAnnotationExtensionKey = "extension";
