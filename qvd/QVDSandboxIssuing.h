// The daemon's side of sandbox extensions: it issues tokens for hosts (read
// access to a plug-in's files, the right to look up its service) and never
// consumes any. Issued tokens are never revoked.
//
// Thread safety: stateless functions; safe from any thread, as the
// SandboxExtensions they are given is.
#pragma once

#include <cstddef>
#include <optional>
#include <string>
#include <string_view>

#include "platform/sandbox/SandboxExtensions.h"
#include "platform/values/Dictionary.h"
#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace qvd {

// A plug-in names the resources it shares; past this many entries the rest
// are ignored (and logged), so one manifest cannot make the daemon mint
// tokens without end.
inline constexpr std::size_t kMaxResourceExtensionEntries = 256;

// A read-only file extension for the file URL's path, canonicalised. Fails
// (POSIX domain, the errno as code) for a URL that is not a file URL
// (EINVAL) or whatever issuing failed with.
platform::Result<std::string> issueFileExtension(
    const platform::sandbox::SandboxExtensions& extensions, std::string_view fileURL);

// A service-lookup extension of class QVServiceExtensionClass for
// `serviceName`.
platform::Result<std::string> issueServiceExtension(
    const platform::sandbox::SandboxExtensions& extensions, std::string_view serviceName);

// Tokens for the resources of the plug-in whose bundle is at `bundleURL`:
// `entries` is one string or a list whose string elements are entries ("."
// for the whole bundle, else a path relative to it); other elements are
// skipped. Each entry maps, exactly as written, to its token. An entry whose
// token cannot be issued is logged (ops, info) and left out; so is one that
// would leave the bundle (a ".." component) or names nothing (empty). A
// leading '/' does not make an entry absolute: it is appended all the same.
// Never fails; the map may be empty. `wholeBundle`, when given, is the
// token of "." if it holds one (used instead of issuing), and receives the
// one issued otherwise.
platform::Dictionary issueResourceExtensions(const platform::sandbox::SandboxExtensions& extensions,
                                             const platform::Value& entries,
                                             std::string_view bundleURL,
                                             std::optional<std::string>* wholeBundle = nullptr);

}  // namespace qvd
