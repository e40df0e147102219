// The path work behind Bundle: canonical paths, and finding a bundle's
// directory and executable on disk.
//
// Thread safety: pure functions over the file system; safe from any thread.
#pragma once

#include <optional>
#include <string>
#include <string_view>

namespace platform::bundle::internal {

// realpath(path), or none when it does not resolve.
std::optional<std::string> resolvedPath(const std::string& path);

// The directory part of a canonical path ("/a/b" -> "/a", "/a" -> "/").
std::string parentOf(const std::string& canonical);
// The last component ("/a/b.app" -> "b.app", "/" -> "").
std::string_view lastComponent(std::string_view canonical);
// The last component is longer than `suffix` and ends with it.
bool nameEndsWith(std::string_view canonical, std::string_view suffix);

// True when `path` is a directory (links followed).
bool isDirectory(const std::string& path);

// True when `directory` holds a regular file (links followed) named Info.vmap.
bool holdsManifest(const std::string& directory);

// The canonical directory from which to walk up for the bundle of the
// executable at `path`: the directory of the file it resolves to, or the
// resolved directory part of `path` when the file itself is missing.
std::optional<std::string> executableDirectory(const std::string& path);

// Walks up from `start` (included) to the first directory holding a
// manifest; none when even "/" holds none.
std::optional<std::string> findBundleDirectory(const std::string& start);

// `<bundle>/<name>` canonical, when `name` is a relative path without ".."
// components and resolves to a regular file inside the bundle.
std::optional<std::string> executableInBundle(const std::string& bundle, std::string_view name);

}  // namespace platform::bundle::internal
