#include "platform/vmap/internal/XmlElement.h"

#include <utility>

#include "platform/vmap/internal/Base64.h"
#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/ScalarText.h"

namespace platform::vmap::internal {
namespace {

constexpr std::pair<std::string_view, Element> kElements[] = {
    {"vmap", Element::Vmap}, {"dict", Element::Dict},     {"array", Element::Array},
    {"key", Element::Key},   {"string", Element::String}, {"integer", Element::Integer},
    {"real", Element::Real}, {"true", Element::True},     {"false", Element::False},
    {"date", Element::Date}, {"data", Element::Data},     {"uuid", Element::Uuid},
};

}  // namespace

std::optional<Element> elementNamed(std::string_view name) {
  for (const auto& [text, element] : kElements)
    if (text == name) return element;
  return std::nullopt;
}

std::string tag(std::string_view name) {
  constexpr std::size_t kMaxShown = 64;
  // Built piece by piece: GCC 12 at -O3 misreports "<" + std::string(...)
  // as an overlapping memcpy (-Wrestrict).
  std::string out(1, '<');
  out.append(name.substr(0, kMaxShown));
  out.append(name.size() > kMaxShown ? "...>" : ">");
  return out;
}

std::string tag(Element element) {
  for (const auto& [text, e] : kElements)
    if (e == element) return tag(text);
  return "<?>";
}

std::string_view trimmed(std::string_view s) {
  while (!s.empty() && isXmlSpace(s.front())) s.remove_prefix(1);
  while (!s.empty() && isXmlSpace(s.back())) s.remove_suffix(1);
  return s;
}

std::optional<Value> scalarValue(Element element, std::string& text, ErrorCode& code,
                                 std::string& message) {
  // Numbers, dates and UUIDs forgive white space around them; a string's
  // white space is its own.
  const std::string_view bare = trimmed(text);
  std::string why;
  switch (element) {
    case Element::String:
      return Value(std::move(text));
    case Element::True:
      return Value(true);
    case Element::False:
      return Value(false);
    case Element::Integer:
      if (auto v = parseInteger(bare, why)) return v;
      code = ErrorCode::BadInteger;
      message = "bad integer " + quoted(bare) + ": " + why;
      return std::nullopt;
    case Element::Real:
      if (auto v = parseReal(bare, why)) return Value(*v);
      code = ErrorCode::BadReal;
      message = "bad real " + quoted(bare) + ": " + why;
      return std::nullopt;
    case Element::Date:
      if (auto v = parseDate(bare)) return Value(*v);
      code = ErrorCode::BadDate;
      message = "bad date " + quoted(bare) + ": expected YYYY-MM-DDTHH:MM:SS[.fraction]Z";
      return std::nullopt;
    case Element::Uuid:
      if (auto v = Uuid::parse(bare)) return Value(*v);
      code = ErrorCode::BadUuid;
      message = "bad UUID " + quoted(bare) + ": expected XXXXXXXX-XXXX-XXXX-XXXX-XXXXXXXXXXXX";
      return std::nullopt;
    case Element::Data: {
      Data data;
      if (decodeBase64(text, data, why)) return Value(std::move(data));
      code = ErrorCode::BadData;
      message = "bad base64 data: " + why;
      return std::nullopt;
    }
    default:
      code = ErrorCode::MisplacedElement;
      message = tag(element) + " holds no scalar";
      return std::nullopt;
  }
}

}  // namespace platform::vmap::internal
