// File URLs ("file:///Applications/A.app"): how plug-in and bundle locations
// travel where a URL is expected.
//
// Thread safety: pure functions.
#pragma once

#include <optional>
#include <string>
#include <string_view>

// "file://" followed by the absolute path, percent-encoding every byte that
// is not an unreserved character or '/'. REQUIRES: path is absolute.
std::string QVFileURLFromPath(std::string_view path);

// The path of a file URL ("file:///x" or "file://localhost/x"), decoded.
// None for any other scheme or host, a relative path, a bad escape, or an
// escaped NUL.
std::optional<std::string> QVPathFromFileURL(std::string_view url);
