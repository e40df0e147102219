"""The protocol's vocabulary: service, keys, request names, flags, error codes."""

DEFAULT_SERVICE = "com.corvane.quorvex.qvd"
SOCKET_DIRECTORY = "run/quorvex/mbx"

PROTOCOL_VERSION = 3
PREVIOUS_PROTOCOL_VERSION = 2

# Request and reply keys.
REQUEST_KEY = "request"
VERSION_KEY = "version"
SYNC_KEY = "sync"
PATHS_KEY = "paths"
UUIDS_KEY = "uuids"
FLAGS_KEY = "flags"
RULES_KEY = "rules"
ENVIRONMENT_KEY = "environment"
ANNOTATIONS_KEY = "annotations"
MATCHES_KEY = "matches"
EXTENSIONS_KEY = "extensions"
CONFLICTS_KEY = "conflicts"
ERROR_CODE_KEY = "errorcode"
ERROR_KEY = "error"

# "match" flags.
DISCOVER_KEEP_VERSIONS = 0x1
DISCOVER_KEEP_DUPLICATES = 0x4
DISCOVER_SYSTEM_ONLY = 0x8
DISCOVER_ALL = 0x200

# "lock" flags.
HOLD_PLUGIN_PATHS = 0x1
HOLD_REFUSE_BUSY = 0x2
HOLD_TERMINATE = 0x4

# Error codes of error replies ("errorcode").
ERROR_REGISTRY_FAILURE = 2
ERROR_INVALID_REQUEST = 4
ERROR_VERSION_MISMATCH = 7
ERROR_BAD_PATH = 9
ERROR_DENIED = 11
ERROR_INVALID_PLUGIN = 12
ERROR_BUSY = 14
ERROR_NOT_FOUND = 15
ERROR_INVALID_VALUE = 18

ERROR_NAMES = {
    ERROR_REGISTRY_FAILURE: "RegistryFailure",
    ERROR_INVALID_REQUEST: "InvalidRequest",
    ERROR_VERSION_MISMATCH: "VersionMismatch",
    ERROR_BAD_PATH: "BadPath",
    ERROR_DENIED: "Denied",
    ERROR_INVALID_PLUGIN: "InvalidPlugIn",
    ERROR_BUSY: "Busy",
    ERROR_NOT_FOUND: "NotFound",
    ERROR_INVALID_VALUE: "InvalidValue",
}

# Entitlements some requests need.
MANAGER_ENTITLEMENT = "com.corvane.private.quorvex.manager"
ENVIRONMENT_ENTITLEMENT = "com.corvane.developer.quorvex.provide-environment"

# Posted (a counter file under <root>/run/quorvex/notify/) after annotation
# and hold changes.
ANNOTATION_CHANGE_NOTIFICATION = "com.corvane.quorvex.annotation-change"
