#include "platform/vmap/internal/XmlWriter.h"

#include <array>
#include <cstdio>
#include <optional>

#include "platform/vmap/internal/Base64.h"
#include "platform/vmap/internal/ErrorText.h"
#include "platform/vmap/internal/ScalarText.h"
#include "platform/vmap/internal/Utf8.h"
#include "platform/vmap/internal/ValuePath.h"

namespace platform::vmap::internal {
namespace {

constexpr std::string_view kHeader =
    "<?xml version=\"1.0\" encoding=\"UTF-8\"?>\n<vmap version=\"1.0\">\n";
constexpr std::string_view kFooter = "</vmap>\n";

// How each byte of text is treated.
enum ByteClass : std::uint8_t { kPlain, kEscaped, kForbidden, kMultibyte };

constexpr std::array<std::uint8_t, 256> makeByteClasses() {
  std::array<std::uint8_t, 256> table{};
  for (int c = 0; c < 0x20; ++c) table[c] = kForbidden;
  table['\t'] = table['\n'] = kPlain;
  // A raw CR would come back as LF (XML normalizes line ends); a character
  // reference survives. '>' is escaped too so that "]]>" never appears.
  table['\r'] = table['<'] = table['>'] = table['&'] = kEscaped;
  for (int c = 0x80; c < 0x100; ++c) table[c] = kMultibyte;
  return table;
}

constexpr std::array<std::uint8_t, 256> kByteClass = makeByteClasses();

std::string_view escapeOf(char c) {
  switch (c) {
    case '<': return "&lt;";
    case '>': return "&gt;";
    case '&': return "&amp;";
    default: return "&#13;";
  }
}

// Writes one value as a document.
// Thread safety: one per call of writeXml; never shared.
class DocumentWriter {
 public:
  explicit DocumentWriter(const WriteLimits& limits) : limits_(limits) {}

  Result<std::string> run(const Value& value) {
    out_ = kHeader;
    if (!write(value, 0)) return *error_;
    out_ += kFooter;
    return std::move(out_);
  }

 private:
  bool fail(ErrorCode code, const std::string& what) {
    error_ = errorPlain(code, path_.describe() + ": " + what);
    return false;
  }

  void indent(std::size_t level) { out_.append(level, '\t'); }

  bool text(std::string_view s) {
    std::size_t plainFrom = 0;
    std::size_t i = 0;
    while (i < s.size()) {
      const unsigned char c = static_cast<unsigned char>(s[i]);
      switch (kByteClass[c]) {
        case kPlain:
          ++i;
          continue;
        case kEscaped:
          out_.append(s.substr(plainFrom, i - plainFrom));
          out_.append(escapeOf(static_cast<char>(c)));
          plainFrom = ++i;
          continue;
        case kForbidden: {
          char name[16];
          std::snprintf(name, sizeof name, "U+%04X", c);
          return fail(ErrorCode::NotRepresentable,
                      std::string("the control character ") + name +
                          " cannot be written in the XML form (the binary form carries it)");
        }
        default: {
          char32_t cp;
          const std::size_t n = decodeUtf8(s, i, cp);
          if (n == 0)
            return fail(ErrorCode::NotRepresentable,
                        "invalid UTF-8 at byte " + std::to_string(i) + " of the text");
          if (!isXmlChar(cp)) {
            char name[16];
            std::snprintf(name, sizeof name, "U+%04X", static_cast<unsigned>(cp));
            return fail(ErrorCode::NotRepresentable, std::string("the character ") + name +
                                                         " cannot be written in the XML form");
          }
          i += n;
        }
      }
    }
    out_.append(s.substr(plainFrom));
    return true;
  }

  void simple(std::size_t level, std::string_view name, std::string_view body) {
    indent(level);
    out_ += '<';
    out_ += name;
    out_ += '>';
    out_ += body;
    out_ += "</";
    out_ += name;
    out_ += ">\n";
  }

  bool enterContainer() {
    if (++depth_ <= limits_.maxDepth) return true;
    return fail(ErrorCode::TooDeep,
                "containers nested deeper than " + std::to_string(limits_.maxDepth));
  }

  bool write(const Value& value, std::size_t level) {
    switch (value.type()) {
      case ValueType::None:
        return fail(ErrorCode::NotRepresentable, "a none value cannot be written");
      case ValueType::Dictionary: {
        if (!enterContainer()) return false;
        const Dictionary& d = *value.dictionary();
        indent(level);
        if (d.empty()) {
          out_ += "<dict/>\n";
        } else {
          out_ += "<dict>\n";
          for (const auto& [key, item] : d) {
            path_.pushKey(key);
            indent(level + 1);
            out_ += "<key>";
            if (!text(key)) return false;
            out_ += "</key>\n";
            if (!write(item, level + 1)) return false;
            path_.pop();
          }
          indent(level);
          out_ += "</dict>\n";
        }
        --depth_;
        return true;
      }
      case ValueType::Array: {
        if (!enterContainer()) return false;
        const Array& a = *value.array();
        indent(level);
        if (a.empty()) {
          out_ += "<array/>\n";
        } else {
          out_ += "<array>\n";
          for (std::size_t i = 0; i < a.size(); ++i) {
            path_.pushIndex(i);
            if (!write(a[i], level + 1)) return false;
            path_.pop();
          }
          indent(level);
          out_ += "</array>\n";
        }
        --depth_;
        return true;
      }
      case ValueType::String:
        indent(level);
        out_ += "<string>";
        if (!text(*value.string())) return false;
        out_ += "</string>\n";
        return true;
      case ValueType::Integer:
        simple(level, "integer", std::to_string(*value.int64()));
        return true;
      case ValueType::Unsigned:
        simple(level, "integer", std::to_string(*value.uint64()));
        return true;
      case ValueType::Real: {
        std::string body;
        appendReal(body, *value.real());
        simple(level, "real", body);
        return true;
      }
      case ValueType::Boolean:
        indent(level);
        out_ += *value.boolean() ? "<true/>\n" : "<false/>\n";
        return true;
      case ValueType::Date: {
        const Date date = *value.date();
        std::optional<std::string> body = formatDate(date);
        if (!body) {
          std::string seconds;
          appendReal(seconds, date.secondsSince1970);
          return fail(ErrorCode::NotRepresentable,
                      "the date " + seconds +
                          " s from 1970 has no exact text in the years 0000-9999 (the binary "
                          "form carries it)");
        }
        simple(level, "date", *body);
        return true;
      }
      case ValueType::Data: {
        std::string body;
        appendBase64(body, *value.data());
        simple(level, "data", body);
        return true;
      }
      case ValueType::Uuid:
        simple(level, "uuid", value.uuid()->toString());
        return true;
    }
    return fail(ErrorCode::NotRepresentable, "a value of unknown kind");
  }

  const WriteLimits& limits_;
  std::string out_;
  ValuePath path_;
  std::size_t depth_ = 0;
  std::optional<Error> error_;
};

}  // namespace

Result<std::string> writeXml(const Value& value, const WriteLimits& limits) {
  return DocumentWriter(limits).run(value);
}

}  // namespace platform::vmap::internal
