// How qvctl shows replies: an indented, human-readable listing by default,
// JSON with --json. Plug-in forms are dictionaries whose keys vary with the
// plug-in, so the listing shows whatever keys a form has.
//
// Thread safety: pure functions.
#pragma once

#include <string>

#include "platform/values/Value.h"

namespace qvctl {

// One line per scalar, "key: value", nested containers indented two spaces
// per level; array items start with "- ". Text appears as is, dates in
// ISO 8601, UUIDs in upper case, data as "<N bytes> BASE64". Empty
// containers show as {} and [].
std::string formatHuman(const platform::Value& value, int indent = 0);

// The plug-in forms of a "match" or "find" reply: "2 plug-ins", then
// "plug-in 1:" and its keys indented, and so on ("no plug-ins" when there
// are none). A single dictionary counts as one form.
std::string formatForms(const platform::Value& forms);

// Pretty-printed JSON (two spaces) and a newline.
std::string formatJson(const platform::Value& value);

}  // namespace qvctl
