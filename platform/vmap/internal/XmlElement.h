// The elements of the XML form: their names, which hold text, and the
// values their text makes.
//
// Thread safety: pure functions.
#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>

#include "platform/values/Value.h"
#include "platform/vmap/VmapError.h"

namespace platform::vmap::internal {

enum class Element : std::uint8_t {
  Vmap, Dict, Array, Key, String, Integer, Real, True, False, Date, Data, Uuid,
};

std::optional<Element> elementNamed(std::string_view name);

// "<name>" for messages, cut short when a name is absurdly long.
std::string tag(std::string_view name);
std::string tag(Element element);

inline bool isContainer(Element e) { return e == Element::Dict || e == Element::Array; }
// Key and the scalars but <true/> and <false/>.
inline bool holdsText(Element e) {
  return e != Element::Vmap && e != Element::Dict && e != Element::Array && e != Element::True &&
         e != Element::False;
}

inline bool isXmlSpace(char c) { return c == ' ' || c == '\t' || c == '\n' || c == '\r'; }
std::string_view trimmed(std::string_view s);

// The value of a scalar element with the given text (moved from for
// strings). On failure returns none and sets the code and message.
// REQUIRES: element is a scalar (not Vmap, Dict, Array or Key).
std::optional<Value> scalarValue(Element element, std::string& text, ErrorCode& code,
                                 std::string& message);

}  // namespace platform::vmap::internal
