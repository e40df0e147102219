// JSON for qvctl: rules and annotations typed on the command line become
// property-list values, and replies become JSON for --json. Dates travel as
// ISO 8601 text, UUIDs as upper-case text and data as base64, since JSON
// has none of them.
//
// Thread safety: pure functions.
#pragma once

#include <string>
#include <string_view>

#include <nlohmann/json.hpp>

#include "platform/values/Result.h"
#include "platform/values/Value.h"

namespace qvctl {

// Objects, arrays, text, booleans and numbers (integers stay integers).
// Malformed JSON and null (which no message can carry) are errors that say
// where.
platform::Result<platform::Value> valueFromJsonText(std::string_view text);

// Dictionaries keep their key order.
nlohmann::ordered_json jsonFromValue(const platform::Value& value);

// Standard base64 with padding.
std::string base64(const platform::Data& data);

}  // namespace qvctl
